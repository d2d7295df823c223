// The AAC encoder loop's work on the host: 20 ms PCM blocks through the VisualOn API of
// libvo-aacenc, as audio_aac_enc drives it. Real-time factor = media time / CPU time.
#include <benchmark/benchmark.h>

#include <cmath>
#include <vector>

#include "buffers/cmnMemory.h"
#include "platform/VoAacApi.h"
#include "platform/host/HostAudio.h"

namespace {

void BM_AacEncodeBlocks(benchmark::State& state) {
    platform::host::HostAacLibrary library;
    void* handle = library.open();
    if (handle == nullptr) {
        state.SkipWithError("libvo-aacenc is not installed");
        return;
    }
    auto get_api = reinterpret_cast<VoGetAacEncApi>(library.symbol(handle, "voGetAACEncAPI"));
    VO_AUDIO_CODECAPI api{};
    get_api(&api);
    VO_MEM_OPERATOR memory{cmnMemAlloc, cmnMemFree, cmnMemSet, cmnMemCopy,
                           cmnMemCheck, nullptr,    nullptr};
    VO_CODEC_INIT_USERDATA user{kVoImfUserMemOperator, &memory, 0, 0};
    VO_HANDLE codec = nullptr;
    api.Init(&codec, kVoAudioCodingAac, &user);
    AACENC_PARAM params{48000, 128000, 2, 1};
    api.SetParam(codec, kVoPidAacEncParam, &params);

    std::vector<int16_t> pcm(1920);
    for (size_t i = 0; i < 960; ++i) {
        pcm[2 * i] = pcm[2 * i + 1] =
            static_cast<int16_t>(8000 * std::sin(2 * M_PI * 1000 * i / 48000.0));
    }
    unsigned char out[3840];
    int64_t blocks = 0;
    for (auto _ : state) {
        VO_CODECBUFFER in{reinterpret_cast<VO_PBYTE>(pcm.data()), 3840, 0};
        api.SetInputData(codec, &in);
        for (;;) {
            VO_CODECBUFFER o{out, sizeof out, 0};
            VO_AUDIO_OUTPUTINFO info{};
            if (api.GetOutputData(codec, &o, &info) != kVoErrNone) break;
            benchmark::DoNotOptimize(out[0]);
        }
        ++blocks;
    }
    api.Uninit(codec);
    library.close(handle);
    // Each block is 20 ms of sound.
    state.counters["realtime_factor"] =
        benchmark::Counter(blocks * 0.020, benchmark::Counter::kIsRate);
}

BENCHMARK(BM_AacEncodeBlocks);

}  // namespace

BENCHMARK_MAIN();
