#include "capture/orvexAudioRecord.h"

#include "base/OrvexLog.h"
#include "platform/Ports.h"

namespace {
constexpr const char* kTag = "orvex:::orvexAudioRecord";
}

orvexAudioRecord::orvexAudioRecord() {
    OrvexLog(kTag, "orvexAudioRecord");
    m_record = platform::AudioRecords().create("orvex");
}

orvexAudioRecord::~orvexAudioRecord() {
    OrvexLog(kTag, "orvexAudioRecord::~orvexAudioRecord");
    m_record.reset();
}

int orvexAudioRecord::setaudiorecord() {
    OrvexLog(kTag, "orvexAudioRecord::setaudiorecord");
    size_t frames = 0;
    if (platform::AudioRecords().getMinFrameCount(&frames, m_sample_rate, m_format,
                                                  static_cast<unsigned>(m_channel_mask)) != 0) {
        return 1;
    }
    if (!m_record) return 1;
    return m_record->set(m_input_source, m_sample_rate, m_format,
                         static_cast<unsigned>(m_channel_mask), frames) == 0
               ? 0
               : 1;
}

long orvexAudioRecord::getMinBufferSize() {
    OrvexLog(kTag, "orvexAudioRecord::getMinBufferSize");
    size_t frames = 0;
    if (platform::AudioRecords().getMinFrameCount(&frames, m_sample_rate, m_format,
                                                  static_cast<unsigned>(m_channel_mask)) != 0) {
        return -1;
    }
    return static_cast<long>(frames) * m_channels * (m_format == 1 ? 2 : 1);
}

int orvexAudioRecord::start() {
    OrvexLog(kTag, "orvexAudioRecord::start");
    return m_record && m_record->start() == 0 ? 0 : 1;
}

int orvexAudioRecord::stop() {
    OrvexLog(kTag, "orvexAudioRecord::stop");
    if (m_record) m_record->stop();
    return 0;
}

long orvexAudioRecord::readaudiodata(void* buffer, size_t size) {
    return m_record ? m_record->read(buffer, size) : -1;
}
