target_sources(telvane_platform PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/CallExecutor.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Connection.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ConnectionCore.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Entitlements.cpp
  ${CMAKE_CURRENT_LIST_DIR}/EpollPort.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ForkMarker.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Line.cpp
  ${CMAKE_CURRENT_LIST_DIR}/LoopThread.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Outbox.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ReplyCollector.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SocketConnection.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SocketListener.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SocketService.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SocketStream.cpp
  ${CMAKE_CURRENT_LIST_DIR}/UnixSocket.cpp
  ${CMAKE_CURRENT_LIST_DIR}/WireCoding.cpp
)
target_link_libraries(telvane_platform PRIVATE telvane_wire CapnProto::capnp-rpc PkgConfig::LIBSYSTEMD Threads::Threads)
