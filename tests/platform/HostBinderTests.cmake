orvex_test(orvex_host_binder_tests
  SOURCES platform/host_binder_test.cpp ${PROJECT_SOURCE_DIR}/tools/AccessUnitSplitter.cpp
  LIBS orvex_platform_host)
