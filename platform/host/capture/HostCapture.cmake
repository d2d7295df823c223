# Real capture on the host: the screen, cameras and capture cards, and the machine's sound,
# all through GStreamer pipelines that end in an appsink; a Wayland screen through a screen
# cast session asked for over D-Bus (GIO, which GStreamer brings anyway) and pipewiresrc. GStreamer lives in a module of its
# own, loaded at the first live source's start, so the pattern and the tone never map it;
# orvex finds it beside itself, programs elsewhere in the build tree where the build put it.
find_package(PkgConfig REQUIRED)
pkg_check_modules(ORVEX_GST REQUIRED IMPORTED_TARGET
                  gstreamer-1.0 gstreamer-app-1.0 gstreamer-video-1.0 gio-2.0 gio-unix-2.0)
add_library(orvex_host_gst MODULE
  ${PROJECT_SOURCE_DIR}/platform/host/capture/GstModule.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/capture/ScreenCast.cpp)
target_include_directories(orvex_host_gst PRIVATE ${PROJECT_SOURCE_DIR})
target_link_libraries(orvex_host_gst PRIVATE PkgConfig::ORVEX_GST)
set_target_properties(orvex_host_gst PROPERTIES
  CXX_VISIBILITY_PRESET hidden
  LIBRARY_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR})

target_sources(orvex_platform_host PRIVATE
  ${PROJECT_SOURCE_DIR}/platform/host/capture/GstSource.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/capture/LaunchChild.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/capture/HostSources.cpp)
target_compile_definitions(orvex_platform_host PRIVATE
  ORVEX_HOST_GST_MODULE_NAME="$<TARGET_FILE_NAME:orvex_host_gst>"
  ORVEX_HOST_GST_MODULE_PATH="$<TARGET_FILE:orvex_host_gst>")
# Whatever links the host platform builds the module too.
add_dependencies(orvex_platform_host orvex_host_gst)
