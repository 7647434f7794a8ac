# Flags of our own targets: kx_options is linked by every one of them.

add_library(kx_options INTERFACE)
target_include_directories(kx_options INTERFACE $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}>)
target_compile_options(kx_options INTERFACE
  -Wall -Wextra -Wpedantic -Wconversion -Wshadow -Werror)

if(KX_SANITIZE)
  add_compile_options(-fsanitize=${KX_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer)
  add_link_options(-fsanitize=${KX_SANITIZE})
endif()

if(KX_FUZZ)
  if(NOT CMAKE_CXX_COMPILER_ID MATCHES "Clang")
    message(FATAL_ERROR "KX_FUZZ needs Clang: libFuzzer is part of it")
  endif()
  add_compile_options(-fsanitize=fuzzer-no-link)
endif()

if(NOT CMAKE_CXX_COMPILER_LAUNCHER)
  find_program(KX_CCACHE ccache)
  if(KX_CCACHE)
    set(CMAKE_CXX_COMPILER_LAUNCHER ${KX_CCACHE})
  endif()
endif()
