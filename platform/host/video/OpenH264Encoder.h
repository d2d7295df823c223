#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

class ISVCEncoder;
struct TagEncParamExt;

namespace platform {
namespace host {

class BitBudget;

// The host's H.264 encoder: OpenH264, loaded at the first Open (a service fed from outside
// never maps it), configured for live baseline video with one slice per picture.
// Thread contract: NOT thread safe; one thread opens, encodes and closes.
class OpenH264Encoder {
public:
    // One NAL unit behind its 4-byte start code.
    struct Nal {
        const uint8_t* data;
        size_t size;
    };
    // One encoded picture: its NAL units in order, valid until the next Encode; `size` counts
    // all their bytes. Empty (count 0) when the rate control skipped it or encoding failed.
    struct Frame {
        const Nal* nals = nullptr;
        size_t count = 0;
        size_t size = 0;
        bool key = false;
        bool skipped = false;
    };

    OpenH264Encoder();
    ~OpenH264Encoder();
    OpenH264Encoder(const OpenH264Encoder&) = delete;
    OpenH264Encoder& operator=(const OpenH264Encoder&) = delete;

    // False (with one log line) when the library does not load or refuses the settings.
    bool Open(int width, int height, int fps, int bitrate);
    void Close();
    bool opened() const { return encoder_ != nullptr; }

    // Encodes one I420 picture of the opened size captured at `ms`.
    Frame Encode(uint8_t* i420, uint64_t ms, bool force_key);

private:
    ISVCEncoder* encoder_ = nullptr;
    std::unique_ptr<TagEncParamExt> params_;  // as opened, for changing the quantiser
    std::unique_ptr<BitBudget> budget_;
    int qp_ = 0;
    std::vector<uint8_t> filler_;
    size_t filler_end_ = 0;  // where the last filler unit closed with 0x80
    int width_ = 0;
    int height_ = 0;
    std::vector<Nal> nals_;
    std::vector<uint8_t> staged_;  // units OpenH264 wrote behind 3-byte start codes
};

}  // namespace host
}  // namespace platform
