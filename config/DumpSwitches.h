#pragma once

// The three debug-dump switches (PCM, AAC, H.264): set from a client's request, cleared when
// capture stops, read by the producers that write the dumps.
// Thread contract: any thread (atomic words). C interface, declared again in skyvo_rtsp.h.
extern "C" {
void set_write_pcm_file();
void reset_write_pcm_file();
unsigned char get_write_pcm_file();
void set_write_aac_file();
void reset_write_aac_file();
unsigned char get_write_aac_file();
void set_write_file_video();
void reset_write_file_video();
unsigned char get_write_file_video();
}
