#pragma once

#include <atomic>

// The binder service thread: opens the vendor binder domain, starts the binder pool (whose
// threads run the frame transactions), registers "orvex.rtp" and idles until told to stop.
// Thread contract: start and close from the main thread.
int start_orvex_system_service();
void close_orvex_system_service();
void* start_orvex_service_thread(void*);
int start_orvex_service_main(std::atomic<bool>* run);
// Whether "orvex.rtp" was served by another process, which ends this one.
bool orvex_system_service_refused();
