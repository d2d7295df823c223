#pragma once

// Starting and stopping the television's H.264 capture: the TV picture as a camera, handed
// to the platform's media recorder, whose frames come back over binder; and the switch of the
// captured sound to the chosen picture.
// Thread contract: start and close run on the RTSP listener's thread (the capture
// callbacks), never at the same time.

// 0 once the recorder runs; 1 after a logged failure (nothing built so far is undone).
int Start_Video_Capture();
// Tears down whatever the start built; safe after any partial start and twice.
void Close_Video_Capture();
// 0 when an audio manager client is held (connecting if needed), -1 when none can be had.
int openAudioManager();
void closeAudioManager();
