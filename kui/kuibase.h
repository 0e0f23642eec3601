// kuibase: creating a situation as a copy of a base situation (-s, -b, -p).
//
// The base's definition row is read from O4SRV.TSITDESC, the -p properties
// replace its columns, its distribution is copied from O4SRV.TOBJACCL unless
// a DISTRIBUTION property was given, and the rows are written under the new
// name. The order of the name checks depends on the server version: servers
// from 06.21 on know long names (O4SRV.TNAME), older ones short names only.
//
// All return 0 on success, otherwise the failing step's result with errCode
// set.
#pragma once

// The whole -s/-b path.
[[nodiscard]] int createFromBaseSituation(void* ctx, char* msgBuf, char** respSlot);
// Reads the base row and builds the column set from it.
[[nodiscard]] int getBasesitProperty(void* ctx, char* msgBuf, char** respSlot);
// Builds the column set from a reply to the base-row query, merges the
// properties and fixes SITNAME, LSTUSRPRF and SITINFO.
[[nodiscard]] int constructValFromBaseSit(const char* reply);
// Reads the base's distribution into distList.
[[nodiscard]] int getBasesitDistribution(void* ctx, char* msgBuf, char** respSlot);
// Appends the NODEL values of a reply to distList (which grows as needed).
[[nodiscard]] int getNodel(const char* reply);
