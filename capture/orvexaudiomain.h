#pragma once

#include <atomic>
#include <cstddef>

#include "buffers/cycle_buffer.h"

// The television's sound: a PCM thread reads the platform's audio record into the PCM ring,
// an encoder thread encodes 20 ms blocks to AAC (ADTS) with the platform's loadable encoder
// and hands each frame to the server's audio input. With kv.orvex.aacenc=inline the PCM thread
// encodes each whole block itself (and the server's audio input sends each frame at once), and
// there is no encoder thread.
// Thread contract: start_audio_record_enc / stop_audio_record_enc from the capture callbacks'
// thread; the two workers share only the PCM ring.

// 20 ms of 48000 Hz stereo 16-bit PCM: one encoder input block.
constexpr int kPcmBlockBytes = 3840;

int start_audio_record_enc();
void stop_audio_record_enc();
// The thread bodies (the run flag is polled; 1 = run).
int audio_output_pcm(std::atomic<int>* run_flag);
int audio_aac_enc(std::atomic<int>* run_flag);
// One PCM block into the ring, three tries 2 ms apart; 1 when written.
int add_audio_pcm_data(const unsigned char* data, int length);

// The PCM ring (100000 bytes), reset at every start.
cycle_buffer& audio_pcm_ring();

void Test_write_audio_pcm(const unsigned char* data, size_t length);
void Test_write_audio_aac(const unsigned char* data, size_t length);
