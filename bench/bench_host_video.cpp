// The host video pipeline's per-frame work at 1280x720 on one core: drawing the test pattern
// alone, and drawing plus OpenH264 encoding as the recorder thread does each frame (binder
// hand-off excluded). items_per_second is frames per second.
#include <benchmark/benchmark.h>

#include <cstdint>
#include <vector>

#include "platform/host/video/HostCamera.h"
#include "platform/host/video/HostMediaRecorder.h"
#include "platform/host/video/TestPattern.h"

namespace {

using platform::host::HostCamera;
using platform::host::HostMediaRecorder;
using platform::host::TestPattern;

void BM_DrawPattern720p(benchmark::State& state) {
    TestPattern pattern(1280, 720);
    std::vector<uint8_t> frame(pattern.frameSize());
    uint32_t n = 0;
    for (auto _ : state) {
        pattern.draw(n, n * 1000u / 30, frame.data());
        benchmark::DoNotOptimize(frame.data());
        ++n;
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_DrawPattern720p);

void BM_DrawAndEncode720p(benchmark::State& state) {
    HostCamera camera;
    camera.unlock();
    HostMediaRecorder recorder;
    recorder.setCamera(camera);
    recorder.setVideoSource(1);
    recorder.setOutputFormat(HostMediaRecorder::kOutputFormatOrvex);
    recorder.setVideoEncoder(HostMediaRecorder::kVideoEncoderH264);
    recorder.setVideoSize(1280, 720);
    recorder.setVideoFrameRate(30);
    recorder.setParameters("video-param-encoding-bitrate=2048000");
    if (recorder.prepare() != 0) {
        state.SkipWithError("the encoder cannot be prepared");
        return;
    }
    uint32_t n = 0;
    uint64_t bytes = 0;
    for (auto _ : state) {
        // Capture times of a 30 fps schedule, so rate control and key frames behave as live.
        HostMediaRecorder::Encoded e = recorder.encodeFrame(n, 1000 + n * 1000u / 30);
        bytes += e.size;
        ++n;
    }
    state.SetItemsProcessed(state.iterations());
    state.counters["kbit_per_s_at_30fps"] =
        benchmark::Counter(static_cast<double>(bytes) * 8 * 30 / 1000 / n);
    recorder.release();
}
BENCHMARK(BM_DrawAndEncode720p)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
