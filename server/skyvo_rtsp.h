#pragma once

// The C interface of the streaming server ("sever" is the interface's own spelling).
// Pointers are the caller's and are not kept, except the quit flag (set_live_quit_flag_var),
// which must outlive the server. Thread contract: init, open, close, the configuration and
// the registrations from the main thread; skyvo_add_h264_data and skyvo_add_mp3_data from any
// threads at any time (the rings' producer contract: buffers/cycle_buffer.h; close waits for the
// calls under way).

#ifdef __cplusplus
extern "C" {
#endif

typedef int (*skyvo_capture_func)(void);

void* skyvo_rtsp_sever_init(void);
// 0 on success, 1 on failure (no server is left then).
int skyvo_rtsp_sever_open(unsigned port);
void skyvo_rtsp_sever_close(void);
void skyvo_set_mp3_rtp_config(unsigned rate);
void skyvo_set_h264_rtp_config(unsigned rate);
// 1 when the frame was stored, 0 when dropped (or no server, or empty input).
int skyvo_add_h264_data(unsigned char* data, unsigned len);
int skyvo_add_mp3_data(unsigned char* data, unsigned len, unsigned timestamp);

// Need an existing server (skyvo_rtsp_sever_init first).
void register_audio_open_thread_func(skyvo_capture_func f);
void register_video_open_thread_func(skyvo_capture_func f);
void register_audio_close_thread_func(skyvo_capture_func f);
void register_video_close_thread_func(skyvo_capture_func f);

// `flag` points to an int that the listener sets to 0 when it ends for good.
void set_live_quit_flag_var(void* flag);

void set_write_pcm_file(void);
void reset_write_pcm_file(void);
unsigned char get_write_pcm_file(void);
void set_write_aac_file(void);
void reset_write_aac_file(void);
unsigned char get_write_aac_file(void);
void set_write_file_video(void);
void reset_write_file_video(void);
unsigned char get_write_file_video(void);

#ifdef __cplusplus
}
#endif
