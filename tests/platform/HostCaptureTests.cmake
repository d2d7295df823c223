orvex_test(orvex_host_capture_tests
  SOURCES platform/host_capture_test.cpp
  LIBS orvex_platform_host)
