# The host's synthetic camera and its H.264 media recorder (OpenH264).
target_sources(orvex_platform_host PRIVATE
  ${PROJECT_SOURCE_DIR}/platform/host/video/BitBudget.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/video/HostCamera.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/video/HostMediaRecorder.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/video/OpenH264Encoder.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/video/TestPattern.cpp)

# OpenH264 is loaded when a recorder first needs an encoder, so a service fed from outside
# ("none") never maps it: only its header is used at build time, and the library is opened by
# the run-time name (SONAME) of the one found here.
find_library(ORVEX_OPENH264_LIBRARY openh264)
find_path(ORVEX_OPENH264_INCLUDE wels/codec_api.h)
if(NOT ORVEX_OPENH264_LIBRARY OR NOT ORVEX_OPENH264_INCLUDE)
  message(FATAL_ERROR "The host platform needs OpenH264 (Debian: libopenh264-dev), "
                      "or configure with -DORVEX_HOST_PLATFORM=OFF")
endif()
# Read at every configure, so that a new OpenH264 is picked up with its new name.
find_program(ORVEX_READELF NAMES ${CMAKE_READELF} readelf)
set(ORVEX_OPENH264_SONAME "")
if(ORVEX_READELF)
  execute_process(COMMAND ${ORVEX_READELF} -d ${ORVEX_OPENH264_LIBRARY}
                  OUTPUT_VARIABLE dynamic ERROR_QUIET)
  if(dynamic MATCHES "soname: \\[([^]]+)\\]")
    set(ORVEX_OPENH264_SONAME "${CMAKE_MATCH_1}")
  endif()
endif()
if(NOT ORVEX_OPENH264_SONAME)
  get_filename_component(ORVEX_OPENH264_SONAME ${ORVEX_OPENH264_LIBRARY} REALPATH)
endif()
message(STATUS "OpenH264 is loaded as ${ORVEX_OPENH264_SONAME}")
target_include_directories(orvex_platform_host PRIVATE ${ORVEX_OPENH264_INCLUDE})
target_compile_definitions(orvex_platform_host PRIVATE
  ORVEX_OPENH264_SONAME="${ORVEX_OPENH264_SONAME}")

# orvex-pattern writes the pattern, capture stamps included, as raw I420 frames, for a window on
# a captured screen to show (the delay of screen capture, bench/README.md).
add_executable(orvex-pattern ${PROJECT_SOURCE_DIR}/tools/orvex_pattern.cpp)
target_link_libraries(orvex-pattern PRIVATE orvex_platform_host)
set_target_properties(orvex-pattern PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR})
