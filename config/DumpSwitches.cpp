#include "config/DumpSwitches.h"

#include <atomic>

namespace {
std::atomic<unsigned char> g_write_pcm{0};
std::atomic<unsigned char> g_write_aac{0};
std::atomic<unsigned char> g_write_video{0};
}  // namespace

extern "C" {
void set_write_pcm_file() { g_write_pcm.store(1, std::memory_order_relaxed); }
void reset_write_pcm_file() { g_write_pcm.store(0, std::memory_order_relaxed); }
unsigned char get_write_pcm_file() { return g_write_pcm.load(std::memory_order_relaxed); }
void set_write_aac_file() { g_write_aac.store(1, std::memory_order_relaxed); }
void reset_write_aac_file() { g_write_aac.store(0, std::memory_order_relaxed); }
unsigned char get_write_aac_file() { return g_write_aac.load(std::memory_order_relaxed); }
void set_write_file_video() { g_write_video.store(1, std::memory_order_relaxed); }
void reset_write_file_video() { g_write_video.store(0, std::memory_order_relaxed); }
unsigned char get_write_file_video() { return g_write_video.load(std::memory_order_relaxed); }
}
