// The frame ring against the floor it cannot beat: the same bytes copied twice with memcpy
// (one copy into the ring, one out). Items of 50 KB (a video frame) and 400 B (an AAC frame).
#include <benchmark/benchmark.h>

#include <cstring>
#include <memory>
#include <vector>

#include "buffers/cycle_buffer.h"

namespace {

void BM_RingNewwriteNewread(benchmark::State& state) {
    const int len = static_cast<int>(state.range(0));
    cycle_buffer ring(8000000);
    std::vector<unsigned char> frame(len, 0x5A);
    auto item = std::make_unique<Buffer_Item>();
    for (auto _ : state) {
        ring.newwrite(frame.data(), len, 1, false);
        ring.newread(*item);
        benchmark::DoNotOptimize(item->data[0]);
    }
    state.SetBytesProcessed(state.iterations() * len);
}

void BM_TwoMemcpy(benchmark::State& state) {
    const size_t len = static_cast<size_t>(state.range(0));
    // Same footprint as the ring: the middle copy walks through 8 MB, as ring storage does.
    std::vector<unsigned char> frame(len, 0x5A), storage(8000000), out(len);
    size_t at = 0;
    for (auto _ : state) {
        if (at + len > storage.size()) at = 0;
        memcpy(storage.data() + at, frame.data(), len);
        memcpy(out.data(), storage.data() + at, len);
        at += len + 8;
        benchmark::DoNotOptimize(out[0]);
        benchmark::ClobberMemory();
    }
    state.SetBytesProcessed(state.iterations() * static_cast<int64_t>(len));
}

BENCHMARK(BM_RingNewwriteNewread)->Arg(50 * 1024)->Arg(400);
BENCHMARK(BM_TwoMemcpy)->Arg(50 * 1024)->Arg(400);

}  // namespace

BENCHMARK_MAIN();
