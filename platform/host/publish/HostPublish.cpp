#include "platform/host/publish/HostPublish.h"

#include "platform/host/HostModule.h"
#include "platform/host/publish/AvModule.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace host {
namespace {

// Loads the module at the first publish; a failure is tried again at the next connection
// attempt. It is never unloaded: sessions from it may outlive any one caller.
AvPublishOpen LoadModule(std::string* error) {
    static thread_mutex mutex;
    static AvPublishOpen open = nullptr;
    thread_mutex::Scoped hold(mutex);
    if (open == nullptr) {
        open = reinterpret_cast<AvPublishOpen>(
            LoadModuleSymbol("ORVEX_HOST_AV_MODULE", ORVEX_HOST_AV_MODULE_NAME,
                             ORVEX_HOST_AV_MODULE_PATH, kAvPublishOpen, error));
    }
    return open;
}

}  // namespace

std::unique_ptr<PublishSession> HostPublish::Open(const PublishTarget& target, std::string* error) {
    std::string ignored;
    if (error == nullptr) error = &ignored;
    AvPublishOpen open = LoadModule(error);
    if (open == nullptr) return nullptr;
    return std::unique_ptr<PublishSession>(open(target, error));
}

}  // namespace host
}  // namespace platform
