#pragma once

#include <utils/RefBase.h>

// Android 8: frameworks/av/include/camera/ICameraRecordingProxy.h
namespace android {

class ICameraRecordingProxy : public virtual RefBase {};

}  // namespace android
