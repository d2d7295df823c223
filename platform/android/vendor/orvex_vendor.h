#pragma once

// The vendor SDK's TV-side interfaces as this service uses them. The SDK's own headers are not
// part of this tree, so the declarations below are the whole contract: check each one against
// the SDK (names, namespace, argument and return types) before the first device build, then
// either keep this file or replace its body with the SDK's includes.

#include <stdint.h>

#include <utils/RefBase.h>
#include <utils/StrongPointer.h>

namespace android {

// Receives the picture-in-picture manager's callbacks on one of the manager's threads.
class PipManagerListener : public virtual RefBase {
public:
    // Generic notification (msg, ext1, ext2), forwarded as is.
    virtual void notify(int msg, int ext1, int ext2) = 0;
    // Traveling events; this declaration assumes the SDK hands over just the event's int type
    // (e.g. 1 unsupported, 3 fast quit). If it passes an event object, read its type there.
    virtual void eventCallback(int eventType) = 0;
};

class PipManager : public virtual RefBase {
public:
    // A client of the PIP service, or null when the service is not running.
    static sp<PipManager> connect();
    // Registers the one listener for this client; 0 on success, the SDK's error otherwise.
    int setListener(const sp<PipManagerListener>& listener);
    // Drops the connection; no callbacks arrive afterwards.
    void disconnect();
};

class TvManager : public virtual RefBase {
public:
    // A client of the TV service, or null when the service is not running.
    static sp<TvManager> connect();
    // The input source shown in the main picture, as the SDK numbers sources.
    int getCurrentMainInputSource();
    // Drops the connection.
    void disconnect();
};

class AudioManager : public virtual RefBase {
public:
    // A client of the vendor audio service, or null when it is not running.
    static sp<AudioManager> connect();
    // Routes the sound of `source` (0 main picture, 1 sub window) to capture `path`; 0 on
    // success.
    int setAudioCaptureSource(int path, int source);
    // Drops the connection.
    void disconnect();
};

}  // namespace android

extern "C" {

// PX_AOUT_Init's parameter block. Only the first field (uint16) is set; the rest is zeroed and
// sized generously so a larger SDK block is never read past its end.
typedef struct {
    uint16_t first;
    uint8_t reserved[126];
} PX_AOUT_INIT_PARAM;

// Every PX_AOUT_* call returns 0 on success.
// Initialises the audio-output library once per process.
int PX_AOUT_Init(PX_AOUT_INIT_PARAM* param);
// The handle already open on output `path`, through `handle`.
int PX_AOUT_GetHandle(int path, int* handle);
// Opens output `path` with `param`; the new handle through `handle`.
int PX_AOUT_Open(int path, int param, int* handle);
// Sets attribute `attr` of `handle`; `value` points at the attribute's value.
int PX_AOUT_SetAttr(int handle, int attr, void* value);
// Closes a handle from PX_AOUT_Open.
int PX_AOUT_Close(int handle);
// Undoes PX_AOUT_Init.
int PX_AOUT_DeInit(void);

}  // extern "C"
