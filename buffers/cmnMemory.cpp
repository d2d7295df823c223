#include "buffers/cmnMemory.h"

#include <cstdlib>
#include <cstring>

#include "base/OrvexLog.h"

// The texts spell "cmnMemmory"; they are kept as operators know them.
extern "C" {

VO_U32 cmnMemAlloc(VO_S32, VO_MEM_INFO* pMemInfo) {
    OrvexPuts("orvex:::cmnMemmory__cmnMemAlloc");
    if (pMemInfo == nullptr) return kVoErrInvalidArg;
    pMemInfo->VBuffer = malloc(static_cast<size_t>(pMemInfo->Size));
    return kVoErrNone;
}

VO_U32 cmnMemFree(VO_S32, VO_PTR pBuff) {
    OrvexPuts("orvex:::cmnMemmory__cmnMemFree");
    free(pBuff);
    return kVoErrNone;
}

VO_U32 cmnMemSet(VO_S32, VO_PTR pBuff, VO_U8 uValue, VO_U32 uSize) {
    OrvexPuts("orvex:::cmnMemmory__cmnMemSet");
    memset(pBuff, uValue, uSize);
    return kVoErrNone;
}

VO_U32 cmnMemCopy(VO_S32, VO_PTR pDest, VO_PTR pSource, VO_U32 uSize) {
    memcpy(pDest, pSource, uSize);
    return kVoErrNone;
}

VO_U32 cmnMemCheck(VO_S32, VO_PTR, VO_U32) {
    OrvexPuts("orvex:::cmnMemmory__cmnMemCheck");
    return kVoErrNone;
}

}  // extern "C"
