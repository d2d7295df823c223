#include "platform/host/HostModule.h"

#include <dlfcn.h>
#include <unistd.h>

#include <cstdlib>

namespace platform {
namespace host {
namespace {

std::string ModulePath(const char* env_var, const char* file_name, const char* build_path) {
    const char* chosen = getenv(env_var);
    if (chosen != nullptr && chosen[0] != '\0') return chosen;
    char exe[4096];
    ssize_t n = readlink("/proc/self/exe", exe, sizeof exe - 1);
    if (n > 0) {
        std::string path(exe, static_cast<size_t>(n));
        path = path.substr(0, path.rfind('/') + 1) + file_name;
        if (access(path.c_str(), F_OK) == 0) return path;
    }
    return build_path;
}

}  // namespace

void* LoadModuleSymbol(const char* env_var, const char* file_name, const char* build_path,
                       const char* symbol, std::string* error) {
    const std::string path = ModulePath(env_var, file_name, build_path);
    void* module = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
    void* entry = module != nullptr ? dlsym(module, symbol) : nullptr;
    if (entry == nullptr) {
        const char* why = dlerror();
        *error = std::string("cannot load ") + file_name + ": " + (why != nullptr ? why : path);
        if (module != nullptr) dlclose(module);
    }
    return entry;
}

}  // namespace host
}  // namespace platform
