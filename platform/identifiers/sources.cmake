target_sources(telvane_platform PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/PersistentIdentifiers.cpp
)
