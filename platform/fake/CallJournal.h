#pragma once

#include <mutex>
#include <string>
#include <vector>

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
    std::mutex mutex_;
    std::vector<std::string> calls_;
};

}  // namespace fake
}  // namespace platform
