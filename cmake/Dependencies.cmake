# The one place where anything that is not ours is found. scripts/install-deps installs what is named here.

find_package(Threads REQUIRED)
find_package(PkgConfig REQUIRED)

find_package(Boost 1.81 REQUIRED)                                            # Boost::headers
find_package(CapnProto 0.9 REQUIRED)                                         # CapnProto::capnp-rpc
find_program(TELVANE_CAPNP capnp REQUIRED)
find_program(TELVANE_CAPNPC_CXX capnpc-c++ REQUIRED)
find_package(CURL REQUIRED)                                                  # CURL::libcurl
find_package(OpenSSL 3 REQUIRED)                                             # OpenSSL::Crypto, OpenSSL::SSL
find_package(ZLIB REQUIRED)                                                  # ZLIB::ZLIB
find_package(fmt REQUIRED)                                                   # fmt::fmt
pkg_check_modules(LIBPLIST REQUIRED IMPORTED_TARGET libplist-2.0)            # PkgConfig::LIBPLIST
pkg_check_modules(LIBSYSTEMD REQUIRED IMPORTED_TARGET libsystemd)            # PkgConfig::LIBSYSTEMD
pkg_check_modules(RAPIDJSON REQUIRED IMPORTED_TARGET RapidJSON)              # PkgConfig::RAPIDJSON
find_package(CLI11 REQUIRED)                                                 # CLI11::CLI11

if(BUILD_TESTING)
  find_package(GTest REQUIRED)                                               # GTest::gmock_main
  include(GoogleTest)
endif()
if(TELVANE_BENCH)
  find_package(benchmark REQUIRED)                                           # benchmark::benchmark
endif()
