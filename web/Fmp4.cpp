#include "web/Fmp4.h"

#include <cstring>

#include "codec/AnnexB.h"

namespace fmp4 {
namespace {

// Big-endian writes into [out, out + cap). The first write that does not fit stops all later
// ones, so a caller checks ok() once at the end instead of after every field.
class Writer {
public:
    Writer(uint8_t* out, size_t cap) : out_(out), cap_(cap) {}

    bool ok() const { return ok_; }
    size_t size() const { return pos_; }

    void U8(uint32_t v) { Put(v, 1); }
    void U16(uint32_t v) { Put(v, 2); }
    void U24(uint32_t v) { Put(v, 3); }
    void U32(uint32_t v) { Put(v, 4); }
    void U64(uint64_t v) { Put(v, 8); }
    void Type(const char* fourcc) { Bytes(reinterpret_cast<const uint8_t*>(fourcc), 4); }

    void Bytes(const uint8_t* p, size_t n) {
        if (!Room(n)) return;
        if (n > 0) memcpy(out_ + pos_, p, n);
        pos_ += n;
    }
    void Zeros(size_t n) {
        if (!Room(n)) return;
        if (n > 0) memset(out_ + pos_, 0, n);
        pos_ += n;
    }

    // A box whose size is not known until Close.
    size_t Open(const char* type) {
        size_t at = pos_;
        U32(0);
        Type(type);
        return at;
    }
    size_t OpenFull(const char* type, uint8_t version, uint32_t flags) {
        size_t at = Open(type);
        U8(version);
        U24(flags);
        return at;
    }
    void Close(size_t at) {
        if (!ok_) return;  // `at` may not even have been written
        uint32_t size = static_cast<uint32_t>(pos_ - at);
        for (int i = 0; i < 4; ++i) out_[at + i] = static_cast<uint8_t>(size >> (24 - 8 * i));
    }

private:
    bool Room(size_t n) {
        if (ok_ && cap_ - pos_ >= n) return true;
        ok_ = false;
        return false;
    }
    void Put(uint64_t v, size_t n) {
        if (!Room(n)) return;
        for (size_t i = 0; i < n; ++i)
            out_[pos_ + i] = static_cast<uint8_t>(v >> (8 * (n - 1 - i)));
        pos_ += n;
    }

    uint8_t* out_;
    size_t cap_;
    size_t pos_ = 0;
    bool ok_ = true;
};

constexpr size_t kMaxParameterSet = 65535;  // avcC stores each length in 16 bits

int NalType(const uint8_t* nal) { return nal[0] & 0x1f; }

int AudioObjectType(const AudioConfig& a) {
    int type = a.asc[0] >> 3;
    if (type == 31) type = 32 + (((a.asc[0] & 7) << 3) | (a.asc[1] >> 5));
    return type;
}

bool ValidVideo(const VideoConfig& v) {
    return v.sps != nullptr && v.sps_len >= 4 && v.sps_len <= kMaxParameterSet &&
           NalType(v.sps) == 7 && v.pps != nullptr && v.pps_len >= 1 &&
           v.pps_len <= kMaxParameterSet && NalType(v.pps) == 8 && v.width > 0 && v.height > 0;
}

bool ValidAudio(const AudioConfig& a) {
    // The sample entry keeps the rate as 16.16 fixed point.
    return AudioObjectType(a) != 0 && a.channels > 0 && a.sample_rate > 0 &&
           a.sample_rate <= 0xffff;
}

void Matrix(Writer& w) {  // identity: no rotation or scaling
    const uint32_t m[9] = {0x10000, 0, 0, 0, 0x10000, 0, 0, 0, 0x40000000};
    for (uint32_t v : m) w.U32(v);
}

void Ftyp(Writer& w, bool video) {
    size_t box = w.Open("ftyp");
    w.Type("isom");
    w.U32(0x200);
    w.Type("isom");
    w.Type("iso6");  // fragments with tfdt
    if (video) w.Type("avc1");
    w.Type("mp41");
    w.Close(box);
}

void Mvhd(Writer& w, uint32_t next_track) {
    size_t box = w.OpenFull("mvhd", 0, 0);
    w.U32(0);           // creation time
    w.U32(0);           // modification time
    w.U32(1000);        // timescale
    w.U32(0);           // duration: unknown, the fragments carry the samples
    w.U32(0x00010000);  // rate 1.0
    w.U16(0x0100);      // volume 1.0
    w.Zeros(2 + 8);
    Matrix(w);
    w.Zeros(24);  // pre_defined
    w.U32(next_track);
    w.Close(box);
}

void Tkhd(Writer& w, uint32_t track, bool audio, uint16_t width, uint16_t height) {
    size_t box = w.OpenFull("tkhd", 0, 3);  // enabled, in movie
    w.U32(0);                               // creation time
    w.U32(0);                               // modification time
    w.U32(track);
    w.U32(0);  // reserved
    w.U32(0);  // duration
    w.Zeros(8);
    w.U16(0);  // layer
    w.U16(0);  // alternate group
    w.U16(audio ? 0x0100 : 0);
    w.U16(0);
    Matrix(w);
    w.U32(static_cast<uint32_t>(width) << 16);
    w.U32(static_cast<uint32_t>(height) << 16);
    w.Close(box);
}

void Mdhd(Writer& w, uint32_t timescale) {
    size_t box = w.OpenFull("mdhd", 0, 0);
    w.U32(0);  // creation time
    w.U32(0);  // modification time
    w.U32(timescale);
    w.U32(0);       // duration
    w.U16(0x55c4);  // language "und", three 5-bit letters
    w.U16(0);
    w.Close(box);
}

void Hdlr(Writer& w, const char* type, const char* name) {
    size_t box = w.OpenFull("hdlr", 0, 0);
    w.U32(0);  // pre_defined
    w.Type(type);
    w.Zeros(12);
    w.Bytes(reinterpret_cast<const uint8_t*>(name), strlen(name) + 1);
    w.Close(box);
}

void Dinf(Writer& w) {
    size_t dinf = w.Open("dinf");
    size_t dref = w.OpenFull("dref", 0, 0);
    w.U32(1);
    w.Close(w.OpenFull("url ", 0, 1));  // the media is in this file
    w.Close(dref);
    w.Close(dinf);
}

void Avc1(Writer& w, const VideoConfig& v) {
    size_t box = w.Open("avc1");
    w.Zeros(6);
    w.U16(1);  // data reference index
    w.Zeros(2 + 2 + 12);
    w.U16(v.width);
    w.U16(v.height);
    w.U32(0x00480000);  // 72 dpi
    w.U32(0x00480000);
    w.U32(0);
    w.U16(1);       // frames per sample
    w.Zeros(32);    // compressor name
    w.U16(0x0018);  // colour, no alpha
    w.U16(0xffff);  // pre_defined -1
    size_t avcc = w.Open("avcC");
    w.U8(1);                // configuration version
    w.Bytes(v.sps + 1, 3);  // profile, constraint flags, level
    w.U8(0xfc | 3);         // NAL lengths in 4 bytes
    w.U8(0xe0 | 1);         // one SPS
    w.U16(static_cast<uint32_t>(v.sps_len));
    w.Bytes(v.sps, v.sps_len);
    w.U8(1);  // one PPS
    w.U16(static_cast<uint32_t>(v.pps_len));
    w.Bytes(v.pps, v.pps_len);
    w.Close(avcc);
    w.Close(box);
}

// The elementary stream descriptors are small enough for one-byte lengths.
void Mp4a(Writer& w, const AudioConfig& a) {
    size_t box = w.Open("mp4a");
    w.Zeros(6);
    w.U16(1);  // data reference index
    w.Zeros(8);
    w.U16(a.channels);
    w.U16(16);  // sample size
    w.U16(0);
    w.U16(0);
    w.U32(a.sample_rate << 16);
    size_t esds = w.OpenFull("esds", 0, 0);
    w.U8(0x03);  // ES_Descriptor
    w.U8(3 + 2 + 13 + 2 + 2 + 2 + 1);
    w.U16(0);    // ES_ID
    w.U8(0);     // no dependency, URL or OCR stream
    w.U8(0x04);  // DecoderConfigDescriptor
    w.U8(13 + 2 + 2);
    w.U8(0x40);           // MPEG-4 audio
    w.U8(0x05 << 2 | 1);  // audio stream, reserved bit
    w.U24(0);             // buffer size
    w.U32(0);             // max bitrate
    w.U32(0);             // average bitrate: variable
    w.U8(0x05);           // decoder configuration: the ASC
    w.U8(2);
    w.Bytes(a.asc, 2);
    w.U8(0x06);  // SLConfigDescriptor
    w.U8(1);
    w.U8(2);  // predefined for MP4 files
    w.Close(esds);
    w.Close(box);
}

void Trak(Writer& w, const VideoConfig* video, const AudioConfig* audio) {
    size_t trak = w.Open("trak");
    if (video) {
        Tkhd(w, kVideoTrack, false, video->width, video->height);
    } else {
        Tkhd(w, kAudioTrack, true, 0, 0);
    }
    size_t mdia = w.Open("mdia");
    Mdhd(w, video ? kVideoTimescale : audio->sample_rate);
    if (video) {
        Hdlr(w, "vide", "VideoHandler");
    } else {
        Hdlr(w, "soun", "SoundHandler");
    }
    size_t minf = w.Open("minf");
    if (video) {
        size_t vmhd = w.OpenFull("vmhd", 0, 1);
        w.Zeros(2 + 6);  // copy mode, opcolor
        w.Close(vmhd);
    } else {
        size_t smhd = w.OpenFull("smhd", 0, 0);
        w.Zeros(2 + 2);  // balance centred
        w.Close(smhd);
    }
    Dinf(w);
    size_t stbl = w.Open("stbl");
    size_t stsd = w.OpenFull("stsd", 0, 0);
    w.U32(1);
    if (video) {
        Avc1(w, *video);
    } else {
        Mp4a(w, *audio);
    }
    w.Close(stsd);
    // Empty tables: every sample is in a fragment.
    for (const char* type : {"stts", "stsc", "stco"}) {
        size_t box = w.OpenFull(type, 0, 0);
        w.U32(0);
        w.Close(box);
    }
    size_t stsz = w.OpenFull("stsz", 0, 0);
    w.U32(0);  // sample size
    w.U32(0);  // sample count
    w.Close(stsz);
    w.Close(stbl);
    w.Close(minf);
    w.Close(mdia);
    w.Close(trak);
}

void Trex(Writer& w, uint32_t track) {
    size_t box = w.OpenFull("trex", 0, 0);
    w.U32(track);
    w.U32(1);  // sample description index
    w.U32(0);  // duration, size, flags: each fragment gives its own
    w.U32(0);
    w.U32(0);
    w.Close(box);
}

// Sample flags: a sync sample depends on no other; any other depends on earlier ones.
constexpr uint32_t kSyncSample = 2u << 24;
constexpr uint32_t kNonSyncSample = 1u << 24 | 1u << 16;

}  // namespace

std::string AvcCodecString(const VideoConfig& video) {
    if (video.sps == nullptr || video.sps_len < 4 || NalType(video.sps) != 7) return "";
    static const char kHex[] = "0123456789abcdef";
    std::string s = "avc1.";
    for (int i = 1; i <= 3; ++i) {
        s += kHex[video.sps[i] >> 4];
        s += kHex[video.sps[i] & 15];
    }
    return s;
}

std::string AacCodecString(const AudioConfig& audio) {
    int type = AudioObjectType(audio);
    if (type == 0) return "";
    return "mp4a.40." + std::to_string(type);
}

size_t WriteInitSegment(const VideoConfig* video, const AudioConfig* audio, uint8_t* out,
                        size_t cap) {
    if (video == nullptr && audio == nullptr) return 0;
    if (video != nullptr && !ValidVideo(*video)) return 0;
    if (audio != nullptr && !ValidAudio(*audio)) return 0;
    Writer w(out, cap);
    Ftyp(w, video != nullptr);
    size_t moov = w.Open("moov");
    Mvhd(w, audio != nullptr ? kAudioTrack + 1 : kVideoTrack + 1);
    if (video) Trak(w, video, nullptr);
    if (audio) Trak(w, nullptr, audio);
    size_t mvex = w.Open("mvex");
    if (video) Trex(w, kVideoTrack);
    if (audio) Trex(w, kAudioTrack);
    w.Close(mvex);
    w.Close(moov);
    return w.ok() ? w.size() : 0;
}

size_t WriteFragmentHeader(uint32_t sequence, uint32_t track, uint64_t decode_time,
                           uint32_t duration, uint32_t sample_size, bool key, uint8_t* out,
                           size_t cap) {
    if (track == 0 || sample_size > 0xffffffffu - 8) return 0;
    Writer w(out, cap);
    size_t moof = w.Open("moof");
    size_t mfhd = w.OpenFull("mfhd", 0, 0);
    w.U32(sequence);
    w.Close(mfhd);
    size_t traf = w.Open("traf");
    size_t tfhd = w.OpenFull("tfhd", 0, 0x020000);  // offsets count from the moof
    w.U32(track);
    w.Close(tfhd);
    size_t tfdt = w.OpenFull("tfdt", 1, 0);
    w.U64(decode_time);
    w.Close(tfdt);
    // One sample with data offset, duration, size and flags present.
    size_t trun = w.OpenFull("trun", 0, 0x000701);
    w.U32(1);
    w.U32(static_cast<uint32_t>(kFragmentHeaderSize));  // payload follows the mdat header
    w.U32(duration);
    w.U32(sample_size);
    w.U32(key ? kSyncSample : kNonSyncSample);
    w.Close(trun);
    w.Close(traf);
    w.Close(moof);
    w.U32(8 + sample_size);
    w.Type("mdat");
    if (!w.ok() || w.size() != kFragmentHeaderSize) return 0;
    return w.size();
}

size_t AnnexBToAvcc(const uint8_t* in, size_t len, uint8_t* out, size_t cap) {
    Writer w(out, cap);
    size_t sc = FindStartCode(in, len, 0);
    while (sc < len) {
        size_t begin = sc + 3;
        size_t next = FindStartCode(in, len, begin);
        size_t end = next;
        while (end > begin && in[end - 1] == 0) --end;  // a 4-byte start code's first zero too
        if (end > begin) {
            w.U32(static_cast<uint32_t>(end - begin));
            w.Bytes(in + begin, end - begin);
        }
        sc = next;
    }
    return w.ok() ? w.size() : 0;
}

}  // namespace fmp4
