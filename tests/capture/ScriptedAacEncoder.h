#pragma once

#include <cstddef>
#include <cstdint>

#include "platform/VoAacApi.h"

// A stand-in for the platform's AAC encoder library, built as its own shared library so the
// encoder loop loads it through dlopen/dlsym exactly as it loads the real one. Each test loads
// a script (what voGetAACEncAPI, Init and each GetOutputData answer) and reads back what the
// loop handed in. Plain C across the library boundary.
// Thread contract: load the script before the encoder thread starts and read the record after
// it has ended; the encoder calls come from that one thread.

extern "C" {

// One GetOutputData answer: the result code and, for a success, the frame it gives.
struct ScriptedAacStep {
    VO_U32 result;
    const uint8_t* frame;  // owned by the test; must outlive the run
    uint32_t frame_length;
};

struct ScriptedAacScript {
    VO_S32 get_api_result;
    VO_U32 init_result;
    // Answers in order; once they are used up every call answers kVoErrOutputBufferSmall, so
    // a loop that misreads the script still ends.
    const ScriptedAacStep* steps;
    size_t step_count;
};

// What the encoder loop did with the library since the last load.
struct ScriptedAacRecord {
    int init_calls;
    int init_codec_type;
    bool init_memory_operators;  // Alloc, Free, Set, Copy and Check all given
    int memory_alloc_result;     // the table's Alloc, called once by Init
    int set_param_calls;
    VO_S32 set_param_id;
    AACENC_PARAM params;
    int set_input_calls;
    uint32_t input_length_other;   // a SetInputData length other than the block size, or 0
    uint8_t input_first_byte[16];  // first byte of each of the first 16 input blocks
    int get_output_calls;
    uint32_t offered_length_other;  // an offered output size other than the block size, or 0
    int uninit_calls;
    bool uninit_handle_matches;
};

typedef void (*ScriptedAacLoad)(const ScriptedAacScript* script);
typedef const ScriptedAacRecord* (*ScriptedAacResult)();

// Exported as "scripted_aac_load" and "scripted_aac_record": the script is copied, the record
// cleared.
void scripted_aac_load(const ScriptedAacScript* script);
const ScriptedAacRecord* scripted_aac_record();

}  // extern "C"
