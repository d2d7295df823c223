# Publishing to media servers with libavformat (FLV over RTMP, MPEG-TS over SRT). Like OpenH264
# and GStreamer it is a host library: the television build never sees these headers. It lives
# in a module of its own, loaded at the first publish, so that a service that does not publish
# never maps FFmpeg and what it pulls in (codecs, TLS, XML, SVG: tens of megabytes).
find_package(PkgConfig REQUIRED)
pkg_check_modules(LIBAV REQUIRED IMPORTED_TARGET libavformat libavcodec libavutil)
add_library(orvex_host_av MODULE ${PROJECT_SOURCE_DIR}/platform/host/publish/AvModule.cpp)
target_include_directories(orvex_host_av PRIVATE ${PROJECT_SOURCE_DIR})
target_link_libraries(orvex_host_av PRIVATE PkgConfig::LIBAV)
set_target_properties(orvex_host_av PROPERTIES
  CXX_VISIBILITY_PRESET hidden
  LIBRARY_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR})

target_sources(orvex_platform_host PRIVATE
  ${PROJECT_SOURCE_DIR}/platform/host/publish/HostPublish.cpp)
target_compile_definitions(orvex_platform_host PRIVATE
  ORVEX_HOST_AV_MODULE_NAME="$<TARGET_FILE_NAME:orvex_host_av>"
  ORVEX_HOST_AV_MODULE_PATH="$<TARGET_FILE:orvex_host_av>")
# Whatever links the host platform builds the module too.
add_dependencies(orvex_platform_host orvex_host_av)
