target_sources(telvane_platform PRIVATE
  ${CMAKE_CURRENT_LIST_DIR}/Allocator.cpp
  ${CMAKE_CURRENT_LIST_DIR}/AppendFile.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Compression.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Crypto.cpp
  ${CMAKE_CURRENT_LIST_DIR}/DefaultsConsent.cpp
  ${CMAKE_CURRENT_LIST_DIR}/DescriptorExtensions.cpp
  ${CMAKE_CURRENT_LIST_DIR}/DictionaryFiles.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Environment.cpp
  ${CMAKE_CURRENT_LIST_DIR}/FileAccess.cpp
  ${CMAKE_CURRENT_LIST_DIR}/FileDescriptor.cpp
  ${CMAKE_CURRENT_LIST_DIR}/FileRemoval.cpp
  ${CMAKE_CURRENT_LIST_DIR}/FileSizeSignal.cpp
  ${CMAKE_CURRENT_LIST_DIR}/FileTimes.cpp
  ${CMAKE_CURRENT_LIST_DIR}/FolderClientBundle.cpp
  ${CMAKE_CURRENT_LIST_DIR}/FolderSubmittableLogs.cpp
  ${CMAKE_CURRENT_LIST_DIR}/JSONParser.cpp
  ${CMAKE_CURRENT_LIST_DIR}/JSONWriter.cpp
  ${CMAKE_CURRENT_LIST_DIR}/Paths.cpp
  ${CMAKE_CURRENT_LIST_DIR}/PlatformError.cpp
  ${CMAKE_CURRENT_LIST_DIR}/KeyedArchive.cpp
  ${CMAKE_CURRENT_LIST_DIR}/LoadedWirelessDiagnostics.cpp
  ${CMAKE_CURRENT_LIST_DIR}/PosixFileSystem.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ProcessIdentifier.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ProcessTransactions.cpp
  ${CMAKE_CURRENT_LIST_DIR}/PropertyList.cpp
  ${CMAKE_CURRENT_LIST_DIR}/PropertyListBinaryScan.cpp
  ${CMAKE_CURRENT_LIST_DIR}/PropertyListNode.cpp
  ${CMAKE_CURRENT_LIST_DIR}/PropertyListUserDefaults.cpp
  ${CMAKE_CURRENT_LIST_DIR}/PropertyListXMLScan.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ReceivedFile.cpp
  ${CMAKE_CURRENT_LIST_DIR}/ServiceManager.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SuiteLock.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SystemDeviceAnswers.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SystemLocale.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SystemPlatform.cpp
  ${CMAKE_CURRENT_LIST_DIR}/SystemProcessMemory.cpp
  ${CMAKE_CURRENT_LIST_DIR}/TerminationSignals.cpp
  ${CMAKE_CURRENT_LIST_DIR}/UTF8.cpp
  ${CMAKE_CURRENT_LIST_DIR}/UnnamedFile.cpp
)
target_link_libraries(telvane_platform PRIVATE
  OpenSSL::Crypto PkgConfig::LIBPLIST PkgConfig::LIBSYSTEMD PkgConfig::RAPIDJSON ZLIB::ZLIB)
# Where install puts the client bundle.
set_source_files_properties(${CMAKE_CURRENT_LIST_DIR}/FolderClientBundle.cpp PROPERTIES
  COMPILE_DEFINITIONS TELVANE_INSTALLED_BUNDLE="${CMAKE_INSTALL_PREFIX}/share/telvane/Telvane.bundle")
# The JSON library asks an empty stack of its own for room by adding to a null pointer, which the sanitizer may not see.
set_source_files_properties(${CMAKE_CURRENT_LIST_DIR}/JSONParser.cpp ${CMAKE_CURRENT_LIST_DIR}/JSONWriter.cpp PROPERTIES
  COMPILE_OPTIONS -fno-sanitize=pointer-overflow)
