#include "capture/orvexaudiomain.h"

#include <pthread.h>
#include <unistd.h>
#include <memory>
#include <vector>

#include "base/OrvexLog.h"
#include "base/ThreadName.h"
#include "buffers/cmnMemory.h"
#include "capture/AudioSampleClock.h"
#include "capture/DumpFile.h"
#include "capture/orvexAudioRecord.h"
#include "config/DumpSwitches.h"
#include "config/GlobalConfig.h"
#include "config/LivecameraResolution.h"
#include "platform/Ports.h"
#include "platform/VoAacApi.h"
#include "server/skyvo_rtsp.h"
#include "stream/FrameTap.h"

namespace {

constexpr const char* kTag = "orvex:::orvexaudiomain";
constexpr int kPxAttrCaptureSource = 5;
// An encoder that keeps answering with codes it does not document is given up on per block,
// so the loop cannot spin for ever.
constexpr int kUnknownResultsMax = 64;
// When the encoder waits for PCM writes, only a lost wake-up would need this bound.
constexpr unsigned kEncoderIdleBoundMs = 100;
constexpr unsigned kAacFrameSamples = 1024;  // per channel, in every AAC-LC frame

struct Worker {
    pthread_t handle{};
    bool started = false;
    std::atomic<int> run{0};
};

Worker g_pcm;
Worker g_aac;
cycle_buffer g_pcm_ring(100000);
PlatformFlavourCache g_flavour;  // this module's own cache

const std::atomic<bool> kAlwaysSay{true};
DumpFile g_pcm_dump(kTag, "/data/app/orvextestaudio.pcm", "/mnt/usb/sda1/orvextestaudio.pcm",
                    209715200,
                    {"/n open /data/app/orvextestaudio.pcm failed /n",
                     "/n open /mnt/usb/sda1/orvextestaudio.pcm failed /n",
                     "Remove /data/app/orvextestaudio.pcm. \n",
                     "Remove /data/app/orvextestaudio.pcm failed. \n",
                     "/n open /data/app/orvextestaudio.pcm failed /n"},
                    &kAlwaysSay);
// The two limits differ on purpose: 200 MiB of PCM, 50 MiB of AAC.
DumpFile g_aac_dump(kTag, "/data/app/orvextestaudio.aac", "/mnt/usb/sda1/orvextestaudio.aac",
                    52428800,
                    {"/n open /data/app/orvextestaudio.aac failed/n",
                     "/n open /mnt/usb/sda1/orvextestaudio.aac failed/n",
                     "Remove /data/app/orvextestaudio.aac. \n",
                     "Remove /data/app/orvextestaudio.aac failed. \n",
                     "/n open /data/app/orvextestaudio.aac failed/n"},
                    &kAlwaysSay);

// The platform's loadable AAC encoder, set up for 48 kHz stereo at 128 kbit/s with ADTS
// headers; the frames of each 20 ms block it takes go to the server's audio input. It runs in
// the encoder thread, or in the PCM thread when that encodes as it reads.
class AacBlockEncoder {
public:
    AacBlockEncoder() = default;
    AacBlockEncoder(const AacBlockEncoder&) = delete;
    AacBlockEncoder& operator=(const AacBlockEncoder&) = delete;
    ~AacBlockEncoder() { Close(); }

    // Loads and starts the encoder; false after the line that says what failed (the library
    // is closed again before it).
    bool Open() {
        library_ = &platform::AacLibrary();
        handle_ = library_->open();
        if (handle_ == nullptr) {
            OrvexPrint("open dll error......");
            return false;
        }
        auto get_api =
            reinterpret_cast<VoGetAacEncApi>(library_->symbol(handle_, "voGetAACEncAPI"));
        if (get_api == nullptr) return Fail("open function error......");
        if (get_api(&api_) != 0) return Fail("pGetAPI function return error");
        if (static_cast<int32_t>(api_.Init(&codec_, kVoAudioCodingAac, &user_)) < 0) {
            codec_ = nullptr;
            return Fail("#### VOI_Error2:fail to initialize the Encoderr###");
        }
        api_.SetParam(codec_, kVoPidAacEncParam, &params_);
        return true;
    }

    // One block of kPcmBlockBytes. False once the encoder has said its output buffer is too
    // small: it has ended and takes no more.
    bool Encode(unsigned char* input) {
        TapAudioPcm(input, kPcmBlockBytes, GetTimeStampMillsec());
        VO_CODECBUFFER in{input, kPcmBlockBytes, 0};
        api_.SetInputData(codec_, &in);
        for (int unknown = 0; unknown < kUnknownResultsMax;) {
            VO_CODECBUFFER out{output_.data(), kPcmBlockBytes, 0};
            VO_AUDIO_OUTPUTINFO info{};
            VO_U32 r = api_.GetOutputData(codec_, &out, &info);
            if (r == kVoErrNone) {
                if (get_write_aac_file()) Test_write_audio_aac(output_.data(), out.Length);
                // 0 lets the ring stamp the frame at write time, as on the television.
                skyvo_add_mp3_data(output_.data(), static_cast<unsigned>(out.Length),
                                   by_samples_ ? clock_.Next(GetTimeStampMillsec()) : 0);
            } else if (r == kVoErrInputBufferSmall) {
                return true;
            } else if (r == kVoErrOutputBufferSmall) {
                return false;
            } else if (++unknown == kUnknownResultsMax) {
                OrvexLog(kTag,
                         "encoder gave %d unknown results for one block (last 0x%lx): "
                         "block skipped",
                         kUnknownResultsMax, static_cast<unsigned long>(r));
            }
        }
        return true;
    }

    // Ends the encoder, then closes its library; nothing when it is not open.
    void Close() {
        if (codec_ != nullptr) api_.Uninit(codec_);
        codec_ = nullptr;
        if (handle_ != nullptr) library_->close(handle_);
        handle_ = nullptr;
    }

private:
    bool Fail(const char* line) {
        Close();
        OrvexPrint("%s", line);
        return false;
    }

    VO_MEM_OPERATOR memory_{cmnMemAlloc, cmnMemFree, cmnMemSet, cmnMemCopy,
                            cmnMemCheck, nullptr,    nullptr};
    VO_CODEC_INIT_USERDATA user_{kVoImfUserMemOperator, &memory_, 0, 0};
    AACENC_PARAM params_{48000, 128000, 2, 1};  // ADTS headers on
    platform::AacLibraryPort* library_ = nullptr;
    void* handle_ = nullptr;
    VO_AUDIO_CODECAPI api_{};
    VO_HANDLE codec_ = nullptr;
    // Its own buffer, taken once per start: a second start's encoder never shares it.
    std::vector<unsigned char> output_ = std::vector<unsigned char>(kPcmBlockBytes);
    const bool by_samples_ = Global_Config::instance()->audio_clock_samples();
    AudioSampleClock clock_{48000, kAacFrameSamples};
};

// The encoder's end, as the encoder thread says it when it leaves.
constexpr const char* kEncoderEndedText = "\n exit audio_aac_enc ";

void EndInlineEncoder(std::unique_ptr<AacBlockEncoder>* encoder) {
    if (!*encoder) return;
    encoder->reset();
    OrvexPrint("%s", kEncoderEndedText);
}

void* PcmThread(void* flag) {
    NameThisThread("orvex-pcm");
    OrvexLog(kTag, "real_start_audiorecord_thread");
    audio_output_pcm(static_cast<std::atomic<int>*>(flag));
    return nullptr;
}

void* AacThread(void* flag) {
    NameThisThread("orvex-aac-enc");
    OrvexLog(kTag, "real_start_audioenc_thread");
    audio_aac_enc(static_cast<std::atomic<int>*>(flag));
    return nullptr;
}

int Start(Worker& w, void* (*body)(void*), const char* name) {
    int rc = pthread_create(&w.handle, nullptr, body, &w.run);
    w.started = rc == 0;
    if (rc != 0) {
        OrvexLogPriority(platform::kLogError, kTag, "%s thread could not start (%d): no sound",
                         name, rc);
    }
    return rc;
}

void Join(Worker& w, const char* text) {
    if (!w.started) return;
    pthread_join(w.handle, nullptr);
    w.started = false;
    OrvexPrint("%s", text);
}

// Sub-window capture: switch the recorded sound to the sub picture. False: do not record.
bool SelectSubSound() {
    PlatformFlavour flavour = g_flavour.Get();
    if (flavour == kFlavourPx) {
        // The literal -1 handle, not the one the video start opened: kept as it is.
        int one = 1;
        platform::PxAudioOut().SetAttr(-1, kPxAttrCaptureSource, &one);
        return true;
    }
    if (flavour == kFlavourSa) {
        std::shared_ptr<platform::AudioManagerClient> manager = platform::AudioManager().connect();
        if (!manager) {
            OrvexLog(kTag, "can't connect audio manager");
            return true;
        }
        manager->setAudioCaptureSource(0, 1);
        manager->disconnect();
        return true;
    }
    OrvexPrint("get property kelvo.build.kelvotv failed[%d].\n", static_cast<int>(flavour));
    return false;
}

}  // namespace

cycle_buffer& audio_pcm_ring() { return g_pcm_ring; }

void Test_write_audio_pcm(const unsigned char* data, size_t length) {
    g_pcm_dump.Write(data, length, capture_state().dump_to_sd);
}

void Test_write_audio_aac(const unsigned char* data, size_t length) {
    g_aac_dump.Write(data, length, capture_state().dump_to_sd);
}

int add_audio_pcm_data(const unsigned char* data, int length) {
    if (data == nullptr || length <= 0) return 0;
    for (int attempt = 0; attempt < 3; ++attempt) {
        if (g_pcm_ring.write(data, length) == length) return 1;
        usleep(2000);
    }
    OrvexDebugPrint("\n add_audio_pcm_data error !");
    return 0;
}

int audio_output_pcm(std::atomic<int>* run_flag) {
    OrvexLog(kTag, "audio_output_pcm");
    orvexAudioRecord record;
    OrvexPrint("\n audiorecord start record !");
    if (run_flag == nullptr) {
        OrvexPrint("\n Start param error !");
        return 1;
    }
    if (!platform::AudioRecords().setFlingerParameters(0, "uac_record=0")) {
        OrvexPrint("\n AudioSystem::get_audio_flinger failed ");
        return 1;
    }
    if (record.setaudiorecord() != 0) {
        OrvexPrint("\n audiorecord setaudiorecord error !");
        return 1;
    }
    long size = record.getMinBufferSize();
    if (size < 1) {
        OrvexPrint("\n audiorecord getMinBufferSize error !");
        return 1;
    }
    if (Global_Config::instance()->isSub() && !SelectSubSound()) return 1;
    if (record.start() != 0) {
        OrvexPrint("\n audiorecord start error !");
        return 1;
    }
    // Encoding here, as each read arrives, spares the encoder thread's wake-up per block; the
    // ring still cuts reads of any size into whole blocks.
    const bool inline_encoder = Global_Config::instance()->aac_inline();
    std::unique_ptr<AacBlockEncoder> encoder;
    if (inline_encoder) {
        OrvexLog(kTag, "audio_aac_enc");
        encoder = std::make_unique<AacBlockEncoder>();
        if (!encoder->Open()) encoder.reset();
    }
    std::vector<unsigned char> buffer(static_cast<size_t>(size));
    std::vector<unsigned char> block(encoder ? kPcmBlockBytes : 0);
    while (run_flag->load(std::memory_order_relaxed) != 0) {
        long n = record.readaudiodata(buffer.data(), buffer.size());
        if (n < 1) {
            OrvexPrint("\n audiorecord readaudiodata error !");
            usleep(5000);
            continue;
        }
        if (get_write_pcm_file()) Test_write_audio_pcm(buffer.data(), static_cast<size_t>(n));
        // An inline encoder that failed or ended takes nothing: no blocks pile up for nobody.
        if (inline_encoder && !encoder) continue;
        add_audio_pcm_data(buffer.data(), static_cast<int>(n));
        while (encoder && g_pcm_ring.read(block.data(), kPcmBlockBytes) > 0) {
            if (!encoder->Encode(block.data())) EndInlineEncoder(&encoder);
        }
    }
    EndInlineEncoder(&encoder);
    record.stop();
    Global_Config::instance()->set_sub_stat(false);
    return 0;
}

int audio_aac_enc(std::atomic<int>* run_flag) {
    OrvexLog(kTag, "audio_aac_enc");
    if (run_flag == nullptr) {
        OrvexPrint("\n Stsrt param error !");  // the spelling operators know
        return 1;
    }
    AacBlockEncoder encoder;
    if (!encoder.Open()) return -1;
    // This thread's own block, taken once per start: a second start stops the first thread,
    // but buffers of its own keep the two from ever sharing one.
    std::vector<unsigned char> input_block(kPcmBlockBytes);
    unsigned char* const input = input_block.data();
    const bool wake_on_write = Global_Config::instance()->wake_on_write();
    while (run_flag->load(std::memory_order_relaxed) != 0) {
        if (g_pcm_ring.read(input, kPcmBlockBytes) < 1) {
            if (!wake_on_write || !g_pcm_ring.wait_readable(kPcmBlockBytes, kEncoderIdleBoundMs)) {
                usleep(5000);
            }
            continue;
        }
        if (!encoder.Encode(input)) break;
    }
    encoder.Close();
    OrvexPrint("%s", kEncoderEndedText);
    return 0;
}

int start_audio_record_enc() {
    OrvexLog(kTag, "start_audio_record_enc");
    // Old threads are stopped first, so that none is left without a handle to join it by.
    // The stop clears the dump switches, which the client set for this start: keep them.
    if (g_pcm.started || g_aac.started) {
        unsigned char pcm = get_write_pcm_file();
        unsigned char aac = get_write_aac_file();
        stop_audio_record_enc();
        if (pcm) set_write_pcm_file();
        if (aac) set_write_aac_file();
    }
    g_pcm_ring.reset();
    g_pcm.run = 1;
    g_aac.run = 1;
    if (!Global_Config::instance()->aac_inline()) Start(g_aac, AacThread, "AAC encoder");
    return Start(g_pcm, PcmThread, "PCM");
}

void stop_audio_record_enc() {
    OrvexLog(kTag, "stop_audio_record_enc");
    if (get_write_pcm_file()) reset_write_pcm_file();
    if (get_write_aac_file()) reset_write_aac_file();
    g_pcm.run = 0;
    g_aac.run = 0;
    g_pcm_ring.wake_reader();  // an encoder waiting for PCM sees the flag at once
    Join(g_pcm, "thread_join(g_thread_audio_pcm.thread_handle)");
    Join(g_aac, "thread_join(g_thread_audio_aac.thread_handle)");
    // Only now: a thread still running could otherwise open its dump again.
    g_pcm_dump.Close();
    g_aac_dump.Close();
    OrvexPrint("stop_audio_record_enc end");
}
