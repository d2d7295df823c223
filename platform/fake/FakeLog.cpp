#include "platform/fake/FakeLog.h"

#include "sync/thread_mutex.h"

namespace platform {
namespace fake {

void FakeLog::Write(int buffer, int priority, const char* tag, const char* text) {
    thread_mutex::Scoped hold(mutex_);
    entries_.push_back(
        Entry{buffer, priority, tag != nullptr ? tag : "", text != nullptr ? text : ""});
}

std::vector<FakeLog::Entry> FakeLog::Entries() {
    thread_mutex::Scoped hold(mutex_);
    return entries_;
}

std::vector<std::string> FakeLog::Texts(const std::string& tag) {
    thread_mutex::Scoped hold(mutex_);
    std::vector<std::string> out;
    for (const Entry& e : entries_) {
        if (e.tag == tag) out.push_back(e.text);
    }
    return out;
}

void FakeLog::Clear() {
    thread_mutex::Scoped hold(mutex_);
    entries_.clear();
}

}  // namespace fake
}  // namespace platform
