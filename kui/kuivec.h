// kuivec: the event-console slot rows of an imported situation.
//
// Every child of an export file's TABLE after the situation ROW is a slot row
// of exactly ten elements named as the columns of O4SRV.EVNTMAP: ID (required,
// equal to the situation's name), OBJCLASS, SEQUENCE, TYPE, LSTDATE,
// LSTUSRPRF, LSTRELEASE, LOCFLAG, RESERVED, MAP (required). Each row is kept
// in vecValArray (10 texts a row, in that column order) and written as one
// EVNTMAP row after the situation's own rows.
#pragma once

class KSH_DOMNode;

// Number of values of a slot row.
enum : int { KUI_VEC_COLUMNS = 10 };

// Checks the `rows` slot rows of `table` (its children after the first) and
// stores them. 0, or 6 with errCode 7 at the first invalid row.
[[nodiscard]] int validateAndConstructVECDetails(int rows, KSH_DOMNode* table);

// Writes one EVNTMAP row per stored slot row, in order, stopping at the first
// failure. 0, 4 (errCode 14), 7 (errCode 97), 8 (statement too long, 99).
[[nodiscard]] int insertVECDetails(void* ctx, char* msgBuf, char** respSlot);
