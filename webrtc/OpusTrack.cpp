#include "webrtc/OpusTrack.h"

#include <opus/opus.h>

namespace webrtc {

OpusTrack::OpusTrack() {
    int error = OPUS_OK;
    m_encoder = opus_encoder_create(kRate, kChannels, OPUS_APPLICATION_AUDIO, &error);
    if (error != OPUS_OK) {
        m_encoder = nullptr;
        return;
    }
    opus_encoder_ctl(m_encoder, OPUS_SET_BITRATE(96000));
    // A weak television CPU encodes this beside everything else; 5 of 10 costs half of 10
    // and is not heard in a cast.
    opus_encoder_ctl(m_encoder, OPUS_SET_COMPLEXITY(5));
    opus_encoder_ctl(m_encoder, OPUS_SET_INBAND_FEC(1));  // what a lossy Wi-Fi loses, said twice
    opus_encoder_ctl(m_encoder, OPUS_SET_PACKET_LOSS_PERC(5));
}

OpusTrack::~OpusTrack() {
    if (m_encoder != nullptr) opus_encoder_destroy(m_encoder);
}

int OpusTrack::Encode() {
    if (m_encoder == nullptr) return 0;
    return opus_encode(m_encoder, m_block, static_cast<int>(kFrameSamples), m_packet,
                       static_cast<opus_int32>(kMaxPacket));
}

}  // namespace webrtc
