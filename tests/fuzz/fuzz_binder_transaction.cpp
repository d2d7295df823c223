// Arbitrary bytes as one transaction into the frame service, with the recording fakes in place
// of the platform: the first byte picks the code (101, 0, or an unknown one), the rest is the
// Parcel. Whatever the service stores must be the frame it was given, split but whole.
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <memory>
#include <vector>

#include "platform/fake/FakePlatform.h"
#include "server/RtspService_t.h"
#include "server/skyvo_rtsp.h"
#include "server/skyvo_service.h"
#include "service/OrvexService.h"

namespace {

struct Service {
    platform::fake::FakePlatform fake;
    std::shared_ptr<platform::BinderService> binder;
    std::unique_ptr<Buffer_Item> item = std::make_unique<Buffer_Item>();
    std::vector<uint8_t> stored;

    Service() {
        skyvo_rtsp_sever_init();
        if (skyvo_rtsp_sever_open(0) != 0) __builtin_trap();
        if (android::OrvexService::instantiate() != 0) __builtin_trap();
        binder = fake.binder.service("orvex.rtp");
        if (!binder) __builtin_trap();
    }
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static Service* service = new Service();  // lives as long as the process
    if (size < 1) return 0;
    static const uint32_t kCodes[] = {101, 0, 2};
    uint32_t code = kCodes[data[0] % 3];
    // An exact-size copy, so that any read past the Parcel's end is caught.
    std::vector<uint8_t> parcel(data + 1, data + size);
    platform::ParcelReader reader(parcel.data(), parcel.size());
    service->binder->onTransact(code, reader, 0);

    service->stored.clear();
    cycle_buffer& ring = skyvo_rtsp_service()->listener()->video_ring();
    while (ring.newread(*service->item)) {
        const Buffer_Item& it = *service->item;
        service->stored.insert(service->stored.end(), it.data, it.data + it.length);
    }
    if (!service->stored.empty()) {
        // Only a frame whose length fits the Parcel is stored, and then all of it.
        int32_t length = 0;
        if (parcel.size() < 4) __builtin_trap();
        memcpy(&length, parcel.data(), 4);
        if (code == 2 || length <= 0 || static_cast<size_t>(length) != service->stored.size() ||
            memcmp(parcel.data() + 4, service->stored.data(), service->stored.size()) != 0) {
            __builtin_trap();
        }
    }
    service->fake.log.Clear();
    service->fake.journal.Clear();
    return 0;
}
