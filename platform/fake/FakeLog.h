#pragma once

#include <string>
#include <vector>

#include "platform/LogPort.h"
#include "sync/thread_mutex.h"

namespace platform {
namespace fake {

// A capturing log sink: keeps every entry so tests can assert exact tags and texts.
// Thread contract: any thread.
class FakeLog final : public LogPort {
public:
    struct Entry {
        int buffer;
        int priority;
        std::string tag;
        std::string text;
    };

    void Write(int buffer, int priority, const char* tag, const char* text) override;

    std::vector<Entry> Entries();
    // The texts logged under `tag`, in order.
    std::vector<std::string> Texts(const std::string& tag);
    void Clear();

private:
    thread_mutex mutex_;
    std::vector<Entry> entries_ ORVEX_GUARDED_BY(mutex_);
};

}  // namespace fake
}  // namespace platform
