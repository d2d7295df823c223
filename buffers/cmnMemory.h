#pragma once

#include "platform/VoAacApi.h"

// The memory operators handed to the AAC encoder library. The module id is ignored.
// C interface: the library calls these through VO_MEM_OPERATOR; pointers are the library's.
extern "C" {
VO_U32 cmnMemAlloc(VO_S32 uID, VO_MEM_INFO* pMemInfo);
VO_U32 cmnMemFree(VO_S32 uID, VO_PTR pBuff);
VO_U32 cmnMemSet(VO_S32 uID, VO_PTR pBuff, VO_U8 uValue, VO_U32 uSize);
VO_U32 cmnMemCopy(VO_S32 uID, VO_PTR pDest, VO_PTR pSource, VO_U32 uSize);
VO_U32 cmnMemCheck(VO_S32 uID, VO_PTR pBuffer, VO_U32 uSize);
}
