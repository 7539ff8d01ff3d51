set(package_dir "${CMAKE_INSTALL_LIBDIR}/cmake/Telvane")

install(TARGETS telvane EXPORT TelvaneTargets
  LIBRARY DESTINATION "${CMAKE_INSTALL_LIBDIR}" COMPONENT client)
install(DIRECTORY include/telvane DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}" COMPONENT client)
# For the authors of adaptors; what it describes is called by the daemon.
install(FILES "${PROJECT_SOURCE_DIR}/platform/include/telvane/VDRAdaptor.h"
  DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}/telvane" COMPONENT client)
# What <telvane/Telvane.h> includes, and the descriptions of values.
set(foundation_headers Base64 Data Date Description Error Export Key SharedCount String UniqueFunction UUID Value)
list(TRANSFORM foundation_headers REPLACE "(.+)" "${PROJECT_SOURCE_DIR}/foundation/\\1.h")
install(FILES ${foundation_headers} DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}/telvane/foundation" COMPONENT client)
# The operator adds publicKey.der: the key that the bags of the place are signed with.
install(DIRECTORY Telvane.bundle DESTINATION share/telvane COMPONENT client)

# The file finds its prefix from where it lies, so an installed tree may be moved.
file(RELATIVE_PATH TELVANE_PC_PREFIX "/p/${CMAKE_INSTALL_LIBDIR}/pkgconfig" "/p")
configure_file(telvane.pc.in telvane.pc @ONLY)
install(FILES "${CMAKE_CURRENT_BINARY_DIR}/telvane.pc" DESTINATION "${CMAKE_INSTALL_LIBDIR}/pkgconfig" COMPONENT client)

configure_package_config_file(TelvaneConfig.cmake.in TelvaneConfig.cmake INSTALL_DESTINATION "${package_dir}")
write_basic_package_version_file("${CMAKE_CURRENT_BINARY_DIR}/TelvaneConfigVersion.cmake"
  COMPATIBILITY SameMajorVersion)
install(EXPORT TelvaneTargets NAMESPACE Telvane:: DESTINATION "${package_dir}" COMPONENT client)
install(FILES "${CMAKE_CURRENT_BINARY_DIR}/TelvaneConfig.cmake" "${CMAKE_CURRENT_BINARY_DIR}/TelvaneConfigVersion.cmake"
  DESTINATION "${package_dir}" COMPONENT client)
