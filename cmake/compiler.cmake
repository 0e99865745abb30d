add_compile_options(-Wall -Wextra -Wconversion -Wsign-conversion -Wformat=2)
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  # g++ 12 at -O2 and -O3 sees overlaps in string concatenations that are not there, and takes the
  # members of a variant that are not in use for uninitialised ones.
  add_compile_options(-Wno-restrict -Wno-maybe-uninitialized)
endif()
if(NOT CMAKE_CXX_FLAGS MATCHES "_FORTIFY_SOURCE")  # distributions choose their own
  add_compile_definitions(_FORTIFY_SOURCE=$<IF:$<CONFIG:Debug>,0,2>)
endif()
# The same figures on every processor: none multiplies and adds in one step, with one rounding.
add_compile_options(-ffp-contract=off)

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
