# The libraries from outside, each as one target in the namespace `dep`.
find_package(PkgConfig REQUIRED)
pkg_check_modules(PLIST REQUIRED IMPORTED_TARGET libplist-2.0)
pkg_check_modules(SQLITE REQUIRED IMPORTED_TARGET sqlite3)
pkg_check_modules(CRYPTO REQUIRED IMPORTED_TARGET libcrypto)
find_package(CLI11 REQUIRED)
find_package(nlohmann_json REQUIRED)
find_package(Threads REQUIRED)


# Loading the shared SQLite, OpenSSL and C++ libraries is most of what an idle start costs;
# where the static ones are missing, the shared ones do.
find_library(SQLITE_STATIC libsqlite3.a)
find_library(CRYPTO_STATIC libcrypto.a)
add_library(dep_plist INTERFACE)
target_link_libraries(dep_plist INTERFACE PkgConfig::PLIST)
add_library(dep_sqlite INTERFACE)
add_library(dep_crypto INTERFACE)
if(QUORLET_STATIC_LIBRARIES AND SQLITE_STATIC AND CRYPTO_STATIC AND NOT QUORLET_SANITIZE)
  target_link_libraries(dep_sqlite INTERFACE ${SQLITE_STATIC} m ${CMAKE_DL_LIBS} Threads::Threads)
  target_link_libraries(dep_crypto INTERFACE ${CRYPTO_STATIC} ${CMAKE_DL_LIBS} Threads::Threads)
  set(QUORLET_PROGRAM_LINK_OPTIONS -static-libstdc++ -static-libgcc)
else()
  target_link_libraries(dep_sqlite INTERFACE PkgConfig::SQLITE)
  target_link_libraries(dep_crypto INTERFACE PkgConfig::CRYPTO)
  set(QUORLET_PROGRAM_LINK_OPTIONS)
endif()
