#pragma once

// The VisualOn audio codec interface as the platform's AAC encoder library exports it
// (voGetAACEncAPI). Declared here rather than taken from a vendor header so the same
// layout serves the television's library and the host's libvo-aacenc. The library's
// 32-bit words are C `long`s: 32 bits on the television, 64 on a 64-bit host, so
// they are declared exactly that way.

extern "C" {

typedef unsigned long VO_U32;
typedef signed long VO_S32;
typedef unsigned char VO_U8;
typedef void* VO_PTR;

constexpr VO_U32 kVoErrNone = 0x00000000;
constexpr VO_U32 kVoErrInvalidArg = 0x80000004;

typedef struct {
    VO_S32 Size;
    VO_S32 Flag;
    VO_PTR VBuffer;
    VO_PTR PBuffer;
} VO_MEM_INFO;

typedef struct VO_MEM_OPERATOR {
    VO_U32 (*Alloc)(VO_S32 uID, VO_MEM_INFO* pMemInfo);
    VO_U32 (*Free)(VO_S32 uID, VO_PTR pBuff);
    VO_U32 (*Set)(VO_S32 uID, VO_PTR pBuff, VO_U8 uValue, VO_U32 uSize);
    VO_U32 (*Copy)(VO_S32 uID, VO_PTR pDest, VO_PTR pSource, VO_U32 uSize);
    VO_U32 (*Check)(VO_S32 uID, VO_PTR pBuffer, VO_U32 uSize);
    VO_S32 (*Compare)(VO_S32 uID, VO_PTR pBuffer1, VO_PTR pBuffer2, VO_U32 uSize);
    VO_U32 (*Move)(VO_S32 uID, VO_PTR pDest, VO_PTR pSource, VO_U32 uSize);
} VO_MEM_OPERATOR;

}  // extern "C"
