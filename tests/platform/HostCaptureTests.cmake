orvex_test(orvex_host_capture_tests
  SOURCES platform/host_capture_test.cpp
  LIBS orvex_platform_host)
# Links neither OpenH264 nor GStreamer, so that it sees what the sources load.
orvex_test(orvex_host_lazy_tests
  SOURCES platform/host_lazy_test.cpp
  LIBS orvex_platform_host)
# Screens through PipeWire, against a PipeWire daemon of its own (skipped without PipeWire).
# The test plays a desktop portal itself, through GIO.
orvex_test(orvex_host_screen_tests
  SOURCES platform/host_screen_test.cpp
  LIBS orvex_platform_host PkgConfig::ORVEX_GST)
