#pragma once

class RtspService_t;

// The server behind the skyvo_* functions, or null: for the process's own layers and tests.
RtspService_t* skyvo_rtsp_service();
