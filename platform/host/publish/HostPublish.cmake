# Publishing to media servers with libavformat (FLV over RTMP, MPEG-TS over SRT). Like OpenH264
# and GStreamer it is a host library: the television build never sees these headers.
find_package(PkgConfig REQUIRED)
pkg_check_modules(LIBAV REQUIRED IMPORTED_TARGET libavformat libavcodec libavutil)
target_sources(orvex_platform_host PRIVATE
  ${PROJECT_SOURCE_DIR}/platform/host/publish/HostPublish.cpp)
target_link_libraries(orvex_platform_host PRIVATE PkgConfig::LIBAV)
