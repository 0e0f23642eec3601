// kuiinsert: the rows that create a situation on the server: the definition
// row (O4SRV.TSITDESC), one distribution row per target (O4SRV.TOBJACCL) and
// the long-name row (O4SRV.TNAME). One INSERT per row, composed in the
// message buffer; there is no transaction, rows written before a failing
// statement stay.
//
// Each routine takes the server context, the message buffer and the response
// slot of createsit and returns 0, 4 (communication error, errCode 14),
// 7 (server exception, errCode 97) or 8 (the statement does not fit the
// message buffer, errCode 99). Callers run them in this order, each only
// after the previous one returned 0.
#pragma once

// Writes the situation column set (elementArray / valueArray) as the
// definition row; REEV_DAYS / REEV_TIME come from reev_days / reev_time when
// those are set. Values are escaped in valueArray. Sets sitInserted.
[[nodiscard]] int insertintoTSITDESC(void* ctx, char* msgBuf, char** respSlot);

// Writes one distribution row per non-blank target of distList (consumed),
// once per run and only after the definition row. Sets distInserted.
[[nodiscard]] int insertintoTOBJACCL(void* ctx, char* msgBuf, char** respSlot);

// Writes the long-name row of sitName / longSitName.
[[nodiscard]] int insertintoTNAME(void* ctx, char* msgBuf, char** respSlot);

// Fills objAcclArray with the 12 column names of a distribution row.
void constructObjAccl();
