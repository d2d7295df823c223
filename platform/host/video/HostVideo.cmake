# The host's synthetic camera and its H.264 media recorder (OpenH264).
target_sources(orvex_platform_host PRIVATE
  ${PROJECT_SOURCE_DIR}/platform/host/video/HostCamera.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/video/HostMediaRecorder.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/video/TestPattern.cpp)

find_package(PkgConfig QUIET)
if(PKG_CONFIG_FOUND)
  pkg_check_modules(ORVEX_OPENH264 QUIET IMPORTED_TARGET openh264)
endif()
if(TARGET PkgConfig::ORVEX_OPENH264)
  target_link_libraries(orvex_platform_host PUBLIC PkgConfig::ORVEX_OPENH264)
else()
  find_library(ORVEX_OPENH264_LIBRARY openh264)
  find_path(ORVEX_OPENH264_INCLUDE wels/codec_api.h)
  if(NOT ORVEX_OPENH264_LIBRARY OR NOT ORVEX_OPENH264_INCLUDE)
    message(FATAL_ERROR "The host platform needs OpenH264 (Debian: libopenh264-dev), "
                        "or configure with -DORVEX_HOST_PLATFORM=OFF")
  endif()
  target_include_directories(orvex_platform_host PRIVATE ${ORVEX_OPENH264_INCLUDE})
  target_link_libraries(orvex_platform_host PUBLIC ${ORVEX_OPENH264_LIBRARY})
endif()
