#include "platform/android/AndroidProperties.h"

#include <cutils/properties.h>

namespace platform {
namespace android_port {

static_assert(PROPERTY_VALUE_MAX == kPropertyValueMax,
              "callers size their buffers with kPropertyValueMax");

int AndroidProperties::Get(const char* key, char* value, const char* default_value) {
    // property_get copies nothing for an unset key with a null default; the port promises "".
    value[0] = '\0';
    return property_get(key, value, default_value != nullptr ? default_value : "");
}

}  // namespace android_port
}  // namespace platform
