#include "platform/fake/CallJournal.h"

namespace platform {
namespace fake {

void CallJournal::Add(std::string call) {
    std::lock_guard<std::mutex> hold(mutex_);
    calls_.push_back(std::move(call));
}

std::vector<std::string> CallJournal::Calls() {
    std::lock_guard<std::mutex> hold(mutex_);
    return calls_;
}

void CallJournal::Clear() {
    std::lock_guard<std::mutex> hold(mutex_);
    calls_.clear();
}

}  // namespace fake
}  // namespace platform
