// An SPS NAL unit as the video send loop meets it: the header byte is skipped and the rest
// parsed, and the bit reader is run to the end of the same bytes. Run with -close_fd_mask=1:
// malformed parameter sets are reported on standard output.
#include <cstddef>
#include <cstdint>

#include "codec/h264_sps.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1 || size > 65536) return 0;
    static h264_sps_t sps;
    h264_parse_sps(data + 1, static_cast<unsigned>(size - 1), 1, &sps);

    // Every reader over the raw bytes, in an order the input picks, until they are used up.
    bs_s s;
    bs_init(&s, data + 1, static_cast<unsigned>(size - 1));
    for (size_t i = 0; i < 4 * size + 64; ++i) {
        switch ((data[0] >> (2 * (i % 4))) & 3) {
            case 0:
                bs_read_ue(&s);
                break;
            case 1:
                bs_read_se(&s);
                break;
            case 2:
                bs_read(&s, static_cast<int>(i % 33));
                break;
            default:
                bs_read1(&s);
                break;
        }
        if (s.p < s.p_start || s.p > s.p_end) __builtin_trap();
    }
    return 0;
}
