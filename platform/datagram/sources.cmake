target_sources(telvane_platform PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/DatagramServer.cpp
  ${CMAKE_CURRENT_LIST_DIR}/IPv4SocketAddress.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ReadableLoop.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SystemDatagramSocket.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SystemDatagramSockets.cpp
)
