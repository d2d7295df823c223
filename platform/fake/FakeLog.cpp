#include "platform/fake/FakeLog.h"

namespace platform {
namespace fake {

void FakeLog::Write(int buffer, int priority, const char* tag, const char* text) {
    std::lock_guard<std::mutex> hold(mutex_);
    entries_.push_back(
        Entry{buffer, priority, tag != nullptr ? tag : "", text != nullptr ? text : ""});
}

std::vector<FakeLog::Entry> FakeLog::Entries() {
    std::lock_guard<std::mutex> hold(mutex_);
    return entries_;
}

std::vector<std::string> FakeLog::Texts(const std::string& tag) {
    std::lock_guard<std::mutex> hold(mutex_);
    std::vector<std::string> out;
    for (const Entry& e : entries_) {
        if (e.tag == tag) out.push_back(e.text);
    }
    return out;
}

void FakeLog::Clear() {
    std::lock_guard<std::mutex> hold(mutex_);
    entries_.clear();
}

}  // namespace fake
}  // namespace platform
