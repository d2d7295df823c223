#pragma once

#include <string>

namespace platform {
namespace host {

// Host libraries that only some runs need (GStreamer, libavformat) live in modules of their
// own, loaded at first use, so that a service that never uses them never maps them.
// Thread contract: any thread; callers keep what they resolved, under their own lock.
//
// The address of `symbol` in the module found at $`env_var` when set, else `file_name` beside
// the executable (an installed service), else `build_path` (test programs elsewhere in the
// build tree). Null, with `*error` naming the module and the loader's reason, when it does not
// load; a later call tries again. A loaded module is never unloaded.
void* LoadModuleSymbol(const char* env_var, const char* file_name, const char* build_path,
                       const char* symbol, std::string* error);

}  // namespace host
}  // namespace platform
