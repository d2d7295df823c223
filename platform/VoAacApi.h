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

typedef void* VO_HANDLE;
typedef long long VO_S64;
typedef unsigned char* VO_PBYTE;

constexpr VO_U32 kVoErrInputBufferSmall = 0x80000005;  // more input needed
constexpr VO_U32 kVoErrOutputBufferSmall = 0x80000009;
constexpr int kVoAudioCodingAac = 8;              // VO_AUDIO_CodingAAC
constexpr VO_S32 kVoPidAacEncParam = 0x42211040;  // VO_PID_AAC_ENCPARAM
constexpr int kVoImfUserMemOperator = 0;          // VO_IMF_USERMEMOPERATOR

typedef struct {
    VO_PBYTE Buffer;
    VO_U32 Length;
    VO_S64 Time;
} VO_CODECBUFFER;

typedef struct {
    int memflag;  // VO_INIT_MEM_FlAG, an int-sized enum
    VO_PTR memData;
    VO_U32 reserved1;
    VO_U32 reserved2;
} VO_CODEC_INIT_USERDATA;

typedef struct {
    VO_S32 SampleRate;
    VO_S32 Channels;
    VO_S32 SampleBits;
} VO_AUDIO_FORMAT;

typedef struct {
    VO_AUDIO_FORMAT Format;
    VO_U32 InputUsed;
    VO_U32 Resever;
} VO_AUDIO_OUTPUTINFO;

typedef struct VO_AUDIO_CODECAPI {
    VO_U32 (*Init)(VO_HANDLE* phCodec, int vType, VO_CODEC_INIT_USERDATA* pUserData);
    VO_U32 (*SetInputData)(VO_HANDLE hCodec, VO_CODECBUFFER* pInput);
    // clang-format 14 breaks this declaration differently on every run.
    // clang-format off
    VO_U32 (*GetOutputData)(VO_HANDLE hCodec, VO_CODECBUFFER* pOutBuffer,
                            VO_AUDIO_OUTPUTINFO* pOutInfo);
    // clang-format on
    VO_U32 (*SetParam)(VO_HANDLE hCodec, VO_S32 uParamID, VO_PTR pData);
    VO_U32 (*GetParam)(VO_HANDLE hCodec, VO_S32 uParamID, VO_PTR pData);
    VO_U32 (*Uninit)(VO_HANDLE hCodec);
} VO_AUDIO_CODECAPI;

typedef struct {
    int sampleRate;
    int bitRate;
    short nChannels;
    short adtsUsed;
} AACENC_PARAM;

typedef VO_S32 (*VoGetAacEncApi)(VO_AUDIO_CODECAPI* api);

}  // extern "C"
