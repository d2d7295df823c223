#include "service/OrvexService.h"

#include "base/OrvexLog.h"
#include "capture/DumpFile.h"
#include "codec/AnnexB.h"
#include "config/DumpSwitches.h"
#include "config/LivecameraResolution.h"
#include "platform/Ports.h"
#include "server/skyvo_rtsp.h"

namespace {

constexpr const char* kTag = "orvex:::orvexservice";
constexpr uint32_t kFrameCode = 101;

// Only "/data/app" has a limit (200 MiB); the same open-failure text serves both folders.
DumpFile g_h264_dump(
    kTag, "/data/app/orvextesth264.h264", "/mnt/usb/sda1/orvextesth264.h264", 0xC800000,
    {"open /data/app/orvextesth264.h264 failed", "open /data/app/orvextesth264.h264 failed",
     "Remove /data/app/orvextesth264.h264. ", "Remove /data/app/orvextesth264.h264 failed. ",
     "/n open /data/app/orvextesth264.h264 failed /n"},
    &capture_state().log_switch);

}  // namespace

namespace android {

int OrvexService::instantiate() {
    OrvexPrintLog(kTag, "OrvexService instantiate");
    auto service = std::make_shared<OrvexService>();
    int ret = platform::Binder().addService("orvex.rtp", service);
    OrvexPrintLog(kTag, "OrvexService ret = %d ", ret);
    return ret;
}

OrvexService::OrvexService() { OrvexPrintLog(kTag, "OrvexService created"); }

OrvexService::~OrvexService() { OrvexPrintLog(kTag, "OrvexService destroyed"); }

int OrvexService::onTransact(uint32_t code, platform::ParcelReader& data, uint32_t) {
    if (code != kFrameCode && code != 0) return platform::kBinderUnknownTransaction;
    int32_t length = data.readInt32();
    const uint8_t* frame = length > 0 ? data.readInplace(static_cast<size_t>(length)) : nullptr;
    data.readInt32();  // read and ignored
    // A length that does not match the data reads as no frame: nothing is stored.
    if (frame == nullptr) return platform::kBinderOk;
    unsigned char* bytes = const_cast<unsigned char*>(frame);
    if (get_write_file_video() != 0)
        Test_write_h264_frame(reinterpret_cast<char*>(bytes), static_cast<unsigned>(length));
    unsigned type = length > 4 ? bytes[4] & 0x1F : 0;
    if (type == 7 || type == 8) {
        sendppsandspsframe(bytes, length);
    } else {
        skyvo_add_h264_data(bytes, static_cast<unsigned>(length));
    }
    return platform::kBinderOk;
}

}  // namespace android

void sendppsandspsframe(unsigned char* buf, int len) {
    OrvexPrintLog(kTag, "sendppsandspsframe");
    if (buf == nullptr || len < 1) return;
    const size_t size = static_cast<size_t>(len);
    size_t unit = 0;
    // The buffer begins with a start code; look for the next ones after it.
    for (size_t i = FindFourByteStartCode(buf, size, 4); i < size;
         i = FindFourByteStartCode(buf, size, i + 4)) {
        skyvo_add_h264_data(buf + unit, static_cast<unsigned>(i - unit));
        unit = i;
    }
    skyvo_add_h264_data(buf + unit, static_cast<unsigned>(size - unit));
}

void Test_write_h264_frame(char* buf, unsigned n) {
    g_h264_dump.Write(buf, n, capture_state().dump_to_sd);
}
