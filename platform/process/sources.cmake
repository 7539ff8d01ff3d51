target_sources(telvane_platform PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/FileExtension.cpp
  ${CMAKE_CURRENT_LIST_DIR}/LibraryPlatform.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ProcessLifetime.cpp
)
