#pragma once

#include <binder/IInterface.h>

// Android 8: frameworks/av/camera/aidl/android/hardware/ICamera (generated interface).
namespace android {
namespace hardware {

class ICamera : public virtual RefBase {};

}  // namespace hardware
}  // namespace android
