#pragma once

#include <memory>
#include <string>

#include "platform/AudioPorts.h"

namespace platform {
namespace android_port {

// Sound capture through AudioRecord, and the audio flinger's parameters.
// Thread contract: as AudioRecordPort.
class AndroidAudioRecordPort final : public AudioRecordPort {
public:
    std::shared_ptr<AudioRecord> create(const std::string& package) override;
    int getMinFrameCount(size_t* frame_count, unsigned sample_rate, int format,
                         unsigned channel_mask) override;
    bool setFlingerParameters(int io, const std::string& key_values) override;
};

}  // namespace android_port
}  // namespace platform
