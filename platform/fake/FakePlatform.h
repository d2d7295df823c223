#pragma once

#include "platform/Ports.h"
#include "platform/fake/CallJournal.h"
#include "platform/fake/FakeCapture.h"
#include "platform/fake/FakeLog.h"
#include "platform/fake/FakeManagers.h"
#include "platform/fake/FakeProperties.h"
#include "platform/fake/FakePublish.h"

namespace platform {
namespace fake {

// Installs recording fakes of every port for the object's lifetime and puts the previous
// ports back afterwards. Thread contract: create and destroy while no other thread uses a
// port; the fakes themselves may be used from any thread.
class FakePlatform {
public:
    FakePlatform();
    ~FakePlatform();
    FakePlatform(const FakePlatform&) = delete;
    FakePlatform& operator=(const FakePlatform&) = delete;

    CallJournal journal;
    FakeLog log;
    FakeProperties properties;
    FakePipManager pip_manager{journal};
    FakeAudioManager audio_manager{journal};
    FakeResults results;
    FakeBinder binder{journal};
    FakeCameraPort camera{journal, results};
    FakeMediaRecorderPort media_recorder{journal, results};
    FakeTvManager tv_manager{journal, results};
    FakePxAudioOut px_audio_out{journal, results};
    FakeAudioRecordPort audio_record{journal, results};
    FakeAacLibrary aac_library{journal};
    FakePublish publish;

private:
    Ports previous_;
};

}  // namespace fake
}  // namespace platform
