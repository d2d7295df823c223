#pragma once

#include <string>
#include <vector>

#include "sync/thread_mutex.h"

namespace platform {
namespace fake {

// The ordered record of the calls the fakes received, one text per call
// ("PipManager::connect", "AudioManager::setAudioCaptureSource(0, 1)").
// Thread contract: any thread.
class CallJournal {
public:
    void Add(std::string call);
    std::vector<std::string> Calls();
    void Clear();

private:
    thread_mutex mutex_;
    std::vector<std::string> calls_ ORVEX_GUARDED_BY(mutex_);
};

}  // namespace fake
}  // namespace platform
