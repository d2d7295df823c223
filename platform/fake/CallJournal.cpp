#include "platform/fake/CallJournal.h"

#include "sync/thread_mutex.h"

namespace platform {
namespace fake {

void CallJournal::Add(std::string call) {
    thread_mutex::Scoped hold(mutex_);
    calls_.push_back(std::move(call));
}

std::vector<std::string> CallJournal::Calls() {
    thread_mutex::Scoped hold(mutex_);
    return calls_;
}

void CallJournal::Clear() {
    thread_mutex::Scoped hold(mutex_);
    calls_.clear();
}

}  // namespace fake
}  // namespace platform
