#pragma once

#include <stdint.h>
#include <sys/types.h>

// The pieces of Android 8's system/media/audio/include/system/audio.h used by AudioRecord.
typedef int audio_source_t;
typedef int audio_format_t;
typedef uint32_t audio_channel_mask_t;
typedef int audio_io_handle_t;
typedef int audio_port_handle_t;

typedef enum {
    AUDIO_SESSION_ALLOCATE = 0,
    AUDIO_SESSION_NONE = 0,
} audio_session_t;

typedef enum {
    AUDIO_INPUT_FLAG_NONE = 0x0,
} audio_input_flags_t;

typedef struct audio_attributes audio_attributes_t;

#define AUDIO_UID_INVALID ((uid_t)-1)
#define AUDIO_PORT_HANDLE_NONE 0
