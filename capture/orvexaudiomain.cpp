#include "capture/orvexaudiomain.h"

#include <pthread.h>
#include <unistd.h>
#include <functional>

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
    std::vector<unsigned char> buffer(static_cast<size_t>(size));
    while (run_flag->load(std::memory_order_relaxed) != 0) {
        long n = record.readaudiodata(buffer.data(), buffer.size());
        if (n < 1) {
            OrvexPrint("\n audiorecord readaudiodata error !");
            usleep(5000);
            continue;
        }
        if (get_write_pcm_file()) Test_write_audio_pcm(buffer.data(), static_cast<size_t>(n));
        add_audio_pcm_data(buffer.data(), static_cast<int>(n));
    }
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
    VO_MEM_OPERATOR memory{cmnMemAlloc, cmnMemFree, cmnMemSet, cmnMemCopy,
                           cmnMemCheck, nullptr,    nullptr};
    VO_CODEC_INIT_USERDATA user{kVoImfUserMemOperator, &memory, 0, 0};
    AACENC_PARAM params{48000, 128000, 2, 1};  // ADTS headers on

    platform::AacLibraryPort& library = platform::AacLibrary();
    // Closed on every way out, before the closing trace.
    std::unique_ptr<void, std::function<void(void*)>> handle(
        library.open(), [&library](void* h) { library.close(h); });
    if (handle == nullptr) {
        OrvexPrint("open dll error......");
        return -1;
    }
    auto get_api = reinterpret_cast<VoGetAacEncApi>(library.symbol(handle.get(), "voGetAACEncAPI"));
    if (get_api == nullptr) {
        handle.reset();
        OrvexPrint("open function error......");
        return -1;
    }
    VO_AUDIO_CODECAPI api{};
    if (get_api(&api) != 0) {
        handle.reset();
        OrvexPrint("pGetAPI function return error");
        return -1;
    }
    VO_HANDLE codec = nullptr;
    if (static_cast<int32_t>(api.Init(&codec, kVoAudioCodingAac, &user)) < 0) {
        handle.reset();
        OrvexPrint("#### VOI_Error2:fail to initialize the Encoderr###");
        return -1;
    }
    api.SetParam(codec, kVoPidAacEncParam, &params);

    // This thread's own blocks, taken once per start: a second start stops the first thread,
    // but buffers of its own keep the two from ever sharing one.
    std::vector<unsigned char> input_block(kPcmBlockBytes), output_block(kPcmBlockBytes);
    unsigned char* const input = input_block.data();
    unsigned char* const output = output_block.data();
    const bool wake_on_write = Global_Config::instance()->wake_on_write();
    const bool by_samples = Global_Config::instance()->audio_clock_samples();
    AudioSampleClock clock(static_cast<unsigned>(params.sampleRate), kAacFrameSamples);
    bool ended = false;
    while (!ended && run_flag->load(std::memory_order_relaxed) != 0) {
        if (g_pcm_ring.read(input, kPcmBlockBytes) < 1) {
            if (!wake_on_write || !g_pcm_ring.wait_readable(kPcmBlockBytes, kEncoderIdleBoundMs)) {
                usleep(5000);
            }
            continue;
        }
        TapAudioPcm(input, kPcmBlockBytes, GetTimeStampMillsec());
        VO_CODECBUFFER in{input, kPcmBlockBytes, 0};
        api.SetInputData(codec, &in);
        for (int unknown = 0; unknown < kUnknownResultsMax;) {
            VO_CODECBUFFER out{output, kPcmBlockBytes, 0};
            VO_AUDIO_OUTPUTINFO info{};
            VO_U32 r = api.GetOutputData(codec, &out, &info);
            if (r == kVoErrNone) {
                if (get_write_aac_file()) Test_write_audio_aac(output, out.Length);
                // 0 lets the ring stamp the frame at write time, as on the television.
                skyvo_add_mp3_data(output, static_cast<unsigned>(out.Length),
                                   by_samples ? clock.Next(GetTimeStampMillsec()) : 0);
            } else if (r == kVoErrInputBufferSmall) {
                break;
            } else if (r == kVoErrOutputBufferSmall) {
                ended = true;
                break;
            } else if (++unknown == kUnknownResultsMax) {
                OrvexLog(kTag,
                         "encoder gave %d unknown results for one block (last 0x%lx): "
                         "block skipped",
                         kUnknownResultsMax, static_cast<unsigned long>(r));
            }
        }
    }
    api.Uninit(codec);
    handle.reset();
    OrvexPrint("\n exit audio_aac_enc ");
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
    Start(g_aac, AacThread, "AAC encoder");
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
