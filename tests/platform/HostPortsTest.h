#pragma once

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <string>
#include <vector>

#include "platform/Ports.h"
#include "platform/fake/FakeLog.h"
#include "platform/fake/FakeProperties.h"

// A binder that takes every frame and counts them.
class CountingBinder final : public platform::BinderPort {
public:
    int initWithDriver(const char*) override { return 0; }
    const void* defaultServiceManager() override { return this; }
    int addService(const char*, std::shared_ptr<platform::BinderService>) override { return 0; }
    void startThreadPool() override {}
    int transact(const char*, uint32_t, const platform::ParcelWriter&) override {
        ++frames;
        return 0;
    }
    std::atomic<int> frames{0};
};

// The host's capture classes run against a fake log, fake properties and a counting binder, put
// in place for each test and taken out after it.
class HostPortsTest : public ::testing::Test {
protected:
    void SetUp() override {
        previous_ = platform::Installed();
        platform::Ports ports = previous_;
        ports.log = &log_;
        ports.properties = &properties_;
        ports.binder = &binder_;
        platform::Install(ports);
    }
    void TearDown() override { platform::Install(previous_); }

    // Host log lines that contain `part`.
    std::vector<std::string> Lines(const std::string& part) {
        std::vector<std::string> out;
        for (const std::string& t : log_.Texts("orvex:::host")) {
            if (t.find(part) != std::string::npos) out.push_back(t);
        }
        return out;
    }

    platform::fake::FakeLog log_;
    platform::fake::FakeProperties properties_;
    CountingBinder binder_;
    platform::Ports previous_;
};
