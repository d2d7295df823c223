# Real capture on the host: the screen, cameras and capture cards, and the machine's sound,
# all through GStreamer pipelines that end in an appsink.
find_package(PkgConfig REQUIRED)
pkg_check_modules(ORVEX_GST REQUIRED IMPORTED_TARGET
                  gstreamer-1.0 gstreamer-app-1.0 gstreamer-video-1.0)
target_sources(orvex_platform_host PRIVATE
  ${PROJECT_SOURCE_DIR}/platform/host/capture/GstSource.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/capture/HostSources.cpp)
target_link_libraries(orvex_platform_host PRIVATE PkgConfig::ORVEX_GST)
