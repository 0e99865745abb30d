add_compile_options(-Wall -Wextra -Wconversion -Wsign-conversion -Wformat=2 -Werror)
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  # g++ 12 at -O2 and -O3 sees overlaps in string concatenations that are not there, and takes the
  # members of a variant that are not in use for uninitialised ones.
  add_compile_options(-Wno-restrict -Wno-maybe-uninitialized)
endif()
add_compile_definitions(_FORTIFY_SOURCE=$<IF:$<CONFIG:Debug>,0,2>)

if(QUORLET_SANITIZE)
  add_compile_options(-fsanitize=address,undefined -fno-sanitize-recover=all
                      -fno-omit-frame-pointer)
  add_link_options(-fsanitize=address,undefined)
endif()

if(QUORLET_FUZZ)
  if(NOT CMAKE_CXX_COMPILER_ID MATCHES "Clang")
    message(FATAL_ERROR "The fuzz targets need clang: set CMAKE_CXX_COMPILER=clang++")
  endif()
  add_compile_options(-fsanitize=fuzzer-no-link)
endif()

# Unused sections of statically linked libraries stay out of the programs.
add_compile_options(-ffunction-sections -fdata-sections)
add_link_options(-Wl,--gc-sections -Wl,--as-needed)
