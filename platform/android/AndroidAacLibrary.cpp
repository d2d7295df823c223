#include "platform/android/AndroidAacLibrary.h"

#include <dlfcn.h>

namespace platform {
namespace android_port {

const char* AndroidAacLibrary::name() { return "libstagefright.so"; }

void* AndroidAacLibrary::open() { return dlopen(name(), RTLD_NOW); }

void* AndroidAacLibrary::symbol(void* library, const char* symbol) {
    return library != nullptr ? dlsym(library, symbol) : nullptr;
}

void AndroidAacLibrary::close(void* library) {
    if (library != nullptr) {
        dlclose(library);
    }
}

}  // namespace android_port
}  // namespace platform
