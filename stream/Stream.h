#pragma once

// The one stream every way of watching attaches to. A consumer (RTSP send sessions, the web
// viewer, the publisher; WebRTC next) needs nothing below this folder's headers:
//   FrameTap.h       the encoded pictures and AAC frames as they enter, one tap for all
//   StreamFacts.h    what the stream says of itself: parameter sets, picture size, AAC config
//   CaptureChoice.h  capture demand: hold capture with a choice of size and rate, release it
//   KeyFrames.h      a consumer that joins asks for a key frame, so it starts at once
//
// Thread contract, for all of them: any thread may call. Tap callbacks run on the producer's
// thread (binder pool for pictures, the AAC encoder thread for sound) and must copy and
// return without blocking; a consumer never holds a producer up. A consumer attaches by
// AddFrameSink, holds capture while it watches (HoldCapture/ReleaseCapture, paired), asks for
// a key frame when it starts, and detaches with RemoveFrameSink, which returns only once no
// call into it is under way.
#include "stream/CaptureChoice.h"
#include "stream/FrameTap.h"
#include "stream/KeyFrames.h"
#include "stream/StreamFacts.h"
