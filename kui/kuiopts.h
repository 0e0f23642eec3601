// kuiopts: the command-line options of createsit and the checks of their
// combination.
//
// Options (compared without regard to letter case):
//   -i, --import FILE          the export file to create the situation from
//   -b, --basedon BASE         the base situation
//   -s, --situation NAME       the new situation (trimmed)
//   -p, --property, --properties NAME=VALUE ...   up to the end of the vector
// The value of -i, -b and -s is the next entry, whatever it looks like; an
// option without a next entry is ignored. -p must be last: any entry after
// it without "=" ends the pairs and marks them invalid.
#pragma once

// Fills the command state from the argument vector (entries 0 and 1 are
// skipped). Never fails: what it finds is recorded.
void parseArgs(int argc, char** argv);

// Checks the options recorded by parseArgs, the name lengths, and validates
// the properties (fetching the event destinations first when "TDST" occurs
// anywhere in the vector). 0; 1 a forbidden or missing combination; 6 an
// over-long name; else the result of GetEventID or validatePropertyNames.
// errCode is set whenever the result is not 0.
[[nodiscard]] int checkArguments(int argc, char** argv, void* ctx);
