target_sources(telvane_platform PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/ConnectivityProbe.cpp
  ${CMAKE_CURRENT_LIST_DIR}/CurlEvents.cpp
  ${CMAKE_CURRENT_LIST_DIR}/CurlLoop.cpp
  ${CMAKE_CURRENT_LIST_DIR}/CurlMulti.cpp
  ${CMAKE_CURRENT_LIST_DIR}/CurlTransfer.cpp
  ${CMAKE_CURRENT_LIST_DIR}/CurlURLSession.cpp
  ${CMAKE_CURRENT_LIST_DIR}/CurlURLSessionProvider.cpp
  ${CMAKE_CURRENT_LIST_DIR}/CurlURLSessionTask.cpp
  ${CMAKE_CURRENT_LIST_DIR}/HTTPServer.cpp
  ${CMAKE_CURRENT_LIST_DIR}/HTTPServerConnection.cpp
  ${CMAKE_CURRENT_LIST_DIR}/TrustStore.cpp
  ${CMAKE_CURRENT_LIST_DIR}/URLSession.cpp
  ${CMAKE_CURRENT_LIST_DIR}/UploadFile.cpp
)
target_link_libraries(telvane_platform PRIVATE Boost::headers CURL::libcurl OpenSSL::SSL OpenSSL::Crypto)
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  # The fences of the network library, which the thread sanitizer does not see, guard nothing of ours.
  set_source_files_properties(${CMAKE_CURRENT_LIST_DIR}/HTTPServer.cpp
    ${CMAKE_CURRENT_LIST_DIR}/HTTPServerConnection.cpp PROPERTIES COMPILE_OPTIONS -Wno-tsan)
endif()
