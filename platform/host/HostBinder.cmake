# The host's binder stand-in (Unix domain sockets) and orvex-feed, which plays an H.264 file
# into a running service through it.
target_sources(orvex_platform_host PRIVATE
  ${PROJECT_SOURCE_DIR}/platform/host/BinderWire.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/HostBinder.cpp
  ${PROJECT_SOURCE_DIR}/platform/host/HostBinderClient.cpp)

add_executable(orvex-feed
  ${PROJECT_SOURCE_DIR}/tools/orvex_feed.cpp
  ${PROJECT_SOURCE_DIR}/tools/AccessUnitSplitter.cpp)
target_link_libraries(orvex-feed PRIVATE orvex_platform_host)
set_target_properties(orvex-feed PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR})
