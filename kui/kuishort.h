// kuishort: short names. The situation table keys situations by a short name
// of at most 31 bytes; servers from 06.21 on also accept long names (more
// than 31 characters, or characters outside Latin-1), stored under a
// generated short name with the long name beside it in O4SRV.TNAME.
//
// A generated short name is a readable form of the long name when that is
// free, otherwise a 15-byte prefix (the long name's start, or the affinity
// text for non-Latin names) followed by a 16-character identifier.
//
// All return 0 on success; other results come with errCode set.
#pragma once

#include <cstddef>

// Size of the buffers the command hands to generateShortName.
enum : size_t { KUI_GEN_NAME_SIZE = 33, KUI_AFFINITY_SIZE = 128 };

// Sets basesitShortName (looked up in TNAME when the base name is a long
// name: 9 with errCode 5 when it is not there). When sitName is a long name,
// moves it to longSitName, generates its short name into sitName and sets
// longNameExist.
[[nodiscard]] int determineShortname(void* ctx, char* msgBuf, char** respSlot);

// Generates a free short name for longSitName into `out` (at least 32
// bytes). 0, or the failing query's result (4, 7, 8).
[[nodiscard]] int generateShortName(char* out, void* ctx, char* msgBuf, char** respSlot);

// 0 when `name` is neither a long name in TNAME nor a short name in
// TSITDESC; 10 when it is either; 4, 7, 8 with errCode set.
[[nodiscard]] int checkShortNameValidity(void* ctx, char* msgBuf, char** respSlot, const char* name);

// The affinity text for the prefix of a non-Latin name into `out`
// (KUI_AFFINITY_SIZE bytes, empty on entry): the imported row's AFFINITIES,
// or the base situation's, read from the server. 0, 4, 7, 8, 9.
[[nodiscard]] int fillAffintiyCharforShortName(char* out, void* ctx, char* msgBuf, char** respSlot);
