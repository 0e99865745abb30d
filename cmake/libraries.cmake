# The libraries from outside. Shared ones: distributions mend them once, for every program.
find_package(PkgConfig REQUIRED)
pkg_check_modules(SQLITE REQUIRED IMPORTED_TARGET sqlite3)
pkg_check_modules(NETTLE REQUIRED IMPORTED_TARGET nettle)
find_package(CLI11 REQUIRED)
find_package(nlohmann_json REQUIRED)
find_package(Threads REQUIRED)
