#pragma once

// The process quit flag as the server sees it: main hands over the address of its flag (an
// int, read and written atomically); the RTSP listener clears it when its loop ends for good.
// Thread contract: any thread.
extern "C" void set_live_quit_flag_var(void* flag);
void ClearLiveQuitFlag();
