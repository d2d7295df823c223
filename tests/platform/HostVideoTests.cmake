orvex_test(orvex_host_video_tests
  SOURCES platform/host_video_test.cpp platform/bit_budget_test.cpp
  LIBS orvex_platform_host orvex_rtp_send)
