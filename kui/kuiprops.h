// kuiprops: validation of the -p properties and the UTF-8 conversion the
// command applies to names and values.
//
// Accepted property names and the column each sets (the name is replaced by
// the column's name in place, the value normalised):
//   DESC, DESCRIPTION -> TEXT (UTF-8)     FORMULA -> PDT (UTF-8, not empty)
//   ADVICE -> ADVISE (UTF-8)              ACTION -> CMD ("*NONE" when empty)
//   RUNONSTART -> AUTOSTART ("*YES"/"*NO")  SITINFO (normalised by validateVEC)
//   INTERVAL (DDD/HHMMSS into reev_days / reev_time)
//   DISTRIBUTION (the distribution list, distList)
#pragma once

class LinkedList;

// Converts `text` from the process's default code page to UTF-8 through a
// KUI_CONV_SIZE-unit UTF-16 buffer. Returns a new[] zero-filled buffer of
// KUI_CONV_SIZE bytes holding the UTF-8 text, or null when the UTF-8 form
// would not fit in KUI_CONV_SIZE - 1 bytes (nothing is ever cut).
char* kuiConvertToUtf8(const char* text);

// Validates the first `count` pairs in order; stops at the first rejected
// one (earlier pairs stay converted). Sets *distFlag when a DISTRIBUTION pair
// is met. `destinations` holds the server's event destination ids (possibly
// empty). 0 when all pairs are accepted, 1 with errCode set otherwise.
[[nodiscard]] int validatePropertyNames(int count, int* distFlag, LinkedList* destinations);
