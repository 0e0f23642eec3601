// kshaffin: the affinity request (method CT_Affinity).
//
// The request asks by exactly one key, read in this order: "id" (an
// affinity id; with the attribute match="subset", in any case, every entry
// whose id holds the key's bits), "product", "text" or "resid". The entries
// found in the platform's affinity table (aff1) are written as
//     <DATA>
//     <AFFINITY><STATIC>..</STATIC><DYNAMIC>..</DYNAMIC><TEXT>..</TEXT>
//     <PRODUCT>..</PRODUCT><RESID>..</RESID></AFFINITY>
//     </DATA>
// (STATIC, DYNAMIC and RESID only when not empty), between the prefix and
// the suffix of the output. Faults are client faults.
//
// Results: 0; 1 more than one key; 2 no key or an empty one; otherwise the
// affinity table's result (5 nothing found), in which case no DATA element
// is written.
#pragma once

#include <cstdint>

#include "kshmtrq.h"

struct AFF1_Entry;

class WSQL_AffinityRequest : public WSQL_MetaRequest {
public:
    WSQL_AffinityRequest(WSQL_Hub* hub, WSQL_HttpServer* http, KSH_XML* document);
    ~WSQL_AffinityRequest() override = default;

    // Finds the first of the four keys present and checks it.
    int parseXML() override;
    // Writes the entries found before the suffix (see processResults).
    int finishOutput() override;
    // The result of the look-up that finishOutput made.
    int processResults() override;

    // The checks of the four keys: 0, or 2 with the client fault.
    virtual int processID();
    virtual int processProduct();
    virtual int processText();
    virtual int processResid();

    // The look-up by the key that was read, writing what it finds.
    int lookUp();

    bool isSubset() const { return subset != 0; }

private:
    int readKey(const char* tag, char** value, uint32_t* length, const char* missing, const char* what);
    void writeEntry(const AFF1_Entry* entry);

    char* id;
    uint32_t idLength;
    char* text;
    uint32_t textLength;
    char* product;
    uint32_t productLength;
    char* resid;
    uint32_t residLength;
    int32_t subset;
    int lookupResult;
};
