#include "platform/android/AndroidPublish.h"

namespace platform {
namespace android_port {

std::unique_ptr<PublishSession> AndroidPublish::Open(const PublishTarget&, std::string* error) {
    if (error != nullptr) *error = "publishing is not available on this platform";
    return nullptr;
}

}  // namespace android_port
}  // namespace platform
