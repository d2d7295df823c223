if(TARGET orvex_platform_host)
  add_executable(bench_host_video ${CMAKE_CURRENT_LIST_DIR}/bench_host_video.cpp)
  target_link_libraries(bench_host_video PRIVATE orvex_platform_host benchmark::benchmark)
endif()
