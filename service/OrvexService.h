#pragma once

#include <cstdint>
#include <memory>

#include "platform/BinderPort.h"

namespace android {

// The binder service "orvex.rtp" through which the platform's media recorder hands over every
// encoded H.264 frame: int32 length, the frame in place (Annex B, starting 00 00 00 01), an
// int32 that is ignored. Parameter-set buffers are split into their NAL units first.
// Thread contract: onTransact runs on any binder pool thread, several at once; each frame lands
// whole in the video ring (its producer contract: buffers/cycle_buffer.h) in the order the calls
// reach it, which is the recorder's order since it sends one frame after another.
class OrvexService : public platform::BinderService {
public:
    // Creates the service and registers it; the registration status.
    static int instantiate();
    OrvexService();
    ~OrvexService() override;

    int onTransact(uint32_t code, platform::ParcelReader& data, uint32_t flags) override;
};

}  // namespace android

// Sends each NAL unit of a parameter-set buffer (SPS, PPS, maybe an IDR) as its own item.
// Only 4-byte start codes delimit units.
void sendppsandspsframe(unsigned char* buf, int len);
// Appends a frame to the H.264 debug dump.
void Test_write_h264_frame(char* buf, unsigned n);
