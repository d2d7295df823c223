#include "tests/capture/ScriptedAacEncoder.h"

#include <cstring>

// The encoder loop's block: 20 ms of 48000 Hz stereo 16-bit PCM.
constexpr uint32_t kBlockBytes = 3840;
constexpr size_t kStepsMax = 256;

namespace {

ScriptedAacScript g_script{};
ScriptedAacStep g_steps[kStepsMax];
size_t g_next = 0;
ScriptedAacRecord g_record{};
int g_handle_token = 0;
VO_MEM_OPERATOR* g_memory = nullptr;
VO_MEM_INFO g_block{};

VO_U32 Init(VO_HANDLE* handle, int type, VO_CODEC_INIT_USERDATA* user) {
    ++g_record.init_calls;
    g_record.init_codec_type = type;
    g_memory = user != nullptr ? static_cast<VO_MEM_OPERATOR*>(user->memData) : nullptr;
    g_record.init_memory_operators = g_memory != nullptr && g_memory->Alloc != nullptr &&
                                     g_memory->Free != nullptr && g_memory->Set != nullptr &&
                                     g_memory->Copy != nullptr && g_memory->Check != nullptr;
    if (static_cast<int32_t>(g_script.init_result) < 0) return g_script.init_result;
    // Work memory through the caller's table, as the real encoder takes it; Uninit frees it,
    // so a loop that forgets Uninit shows up as a leak.
    if (g_record.init_memory_operators) {
        g_block = VO_MEM_INFO{1024, 0, nullptr, nullptr};
        g_record.memory_alloc_result = static_cast<int>(g_memory->Alloc(0, &g_block));
    }
    if (handle != nullptr) *handle = &g_handle_token;
    return g_script.init_result;
}

VO_U32 SetInputData(VO_HANDLE, VO_CODECBUFFER* input) {
    int n = g_record.set_input_calls++;
    if (input == nullptr) return kVoErrInvalidArg;
    uint32_t length = static_cast<uint32_t>(input->Length);
    if (length != kBlockBytes) g_record.input_length_other = length;
    if (n < 16 && input->Buffer != nullptr) g_record.input_first_byte[n] = input->Buffer[0];
    return kVoErrNone;
}

VO_U32 GetOutputData(VO_HANDLE, VO_CODECBUFFER* output, VO_AUDIO_OUTPUTINFO*) {
    ++g_record.get_output_calls;
    if (output == nullptr) return kVoErrInvalidArg;
    uint32_t offered = static_cast<uint32_t>(output->Length);
    if (offered != kBlockBytes) g_record.offered_length_other = offered;
    if (g_next >= g_script.step_count) return kVoErrOutputBufferSmall;
    const ScriptedAacStep& step = g_steps[g_next++];
    if (step.result == kVoErrNone) {
        uint32_t n = step.frame_length < offered ? step.frame_length : offered;
        if (n > 0) memcpy(output->Buffer, step.frame, n);
        output->Length = n;
    }
    return step.result;
}

VO_U32 SetParam(VO_HANDLE, VO_S32 id, VO_PTR data) {
    ++g_record.set_param_calls;
    g_record.set_param_id = id;
    if (data != nullptr) memcpy(&g_record.params, data, sizeof(AACENC_PARAM));
    return kVoErrNone;
}

VO_U32 GetParam(VO_HANDLE, VO_S32, VO_PTR) { return kVoErrNone; }

VO_U32 Uninit(VO_HANDLE handle) {
    ++g_record.uninit_calls;
    g_record.uninit_handle_matches = handle == &g_handle_token;
    if (g_memory != nullptr && g_block.VBuffer != nullptr) g_memory->Free(0, g_block.VBuffer);
    g_block = VO_MEM_INFO{};
    return kVoErrNone;
}

}  // namespace

extern "C" {

__attribute__((visibility("default"))) VO_S32 voGetAACEncAPI(VO_AUDIO_CODECAPI* api) {
    if (g_script.get_api_result != 0 || api == nullptr) return g_script.get_api_result;
    *api = VO_AUDIO_CODECAPI{Init, SetInputData, GetOutputData, SetParam, GetParam, Uninit};
    return 0;
}

__attribute__((visibility("default"))) void scripted_aac_load(const ScriptedAacScript* script) {
    g_script = *script;
    g_script.step_count = script->step_count < kStepsMax ? script->step_count : kStepsMax;
    for (size_t i = 0; i < g_script.step_count; ++i) g_steps[i] = script->steps[i];
    g_script.steps = g_steps;
    g_next = 0;
    g_record = ScriptedAacRecord{};
    g_memory = nullptr;
}

__attribute__((visibility("default"))) const ScriptedAacRecord* scripted_aac_record() {
    return &g_record;
}

}  // extern "C"
