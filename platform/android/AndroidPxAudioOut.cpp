#include "platform/android/AndroidPxAudioOut.h"

#include <cstring>

#include "platform/android/vendor/orvex_vendor.h"

namespace platform {
namespace android_port {

int AndroidPxAudioOut::Init(unsigned short first_field) {
    PX_AOUT_INIT_PARAM param;
    std::memset(&param, 0, sizeof(param));
    param.first = first_field;
    return PX_AOUT_Init(&param);
}

int AndroidPxAudioOut::GetHandle(int path, int* handle) { return PX_AOUT_GetHandle(path, handle); }

int AndroidPxAudioOut::Open(int path, int param, int* handle) {
    return PX_AOUT_Open(path, param, handle);
}

int AndroidPxAudioOut::SetAttr(int handle, int attr, int* value) {
    return PX_AOUT_SetAttr(handle, attr, value);
}

int AndroidPxAudioOut::Close(int handle) { return PX_AOUT_Close(handle); }

int AndroidPxAudioOut::DeInit() { return PX_AOUT_DeInit(); }

}  // namespace android_port
}  // namespace platform
