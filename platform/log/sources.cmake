target_sources(telvane_platform PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/JournalLog.cpp
  ${CMAKE_CURRENT_LIST_DIR}/LineWriter.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Log.cpp
  ${CMAKE_CURRENT_LIST_DIR}/LogFactory.cpp
  ${CMAKE_CURRENT_LIST_DIR}/StandardErrorLog.cpp
)
target_link_libraries(telvane_platform PRIVATE PkgConfig::LIBSYSTEMD)
