# Warning and sanitizer flags shared by every target of the project.
function(vx_target_options target)
  target_compile_options(${target} PRIVATE -Wall -Wextra)
  # GCC 12 at -O3 reports impossible overlapping copies inside std::string (-Wrestrict).
  if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
    target_compile_options(${target} PRIVATE -Wno-restrict)
  endif()
  if(VX_WERROR)
    target_compile_options(${target} PRIVATE -Werror)
  endif()
endfunction()

if(VX_SANITIZE)
  add_compile_options(-fsanitize=${VX_SANITIZE} -fno-omit-frame-pointer -fno-sanitize-recover=all)
  add_link_options(-fsanitize=${VX_SANITIZE})
endif()
if(VX_BUILD_FUZZ)
  if(NOT CMAKE_CXX_COMPILER_ID MATCHES "Clang")
    message(FATAL_ERROR "VX_BUILD_FUZZ needs clang (libFuzzer)")
  endif()
  add_compile_options(-fsanitize=fuzzer-no-link)
endif()

# vx_add_test(NAME src...): one GoogleTest executable, registered with CTest.
function(vx_add_test name)
  add_executable(${name} ${ARGN})
  target_link_libraries(${name} PRIVATE vxcore3 GTest::gtest GTest::gtest_main Threads::Threads
                        PkgConfig::SQLITE3)
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR}/tests)
  vx_target_options(${name})
  gtest_discover_tests(${name} DISCOVERY_TIMEOUT 60 PROPERTIES TIMEOUT 300)
endfunction()

# vx_add_fuzzer(NAME src...): a libFuzzer target, run briefly by CI.
function(vx_add_fuzzer name)
  add_executable(${name} ${ARGN})
  target_link_libraries(${name} PRIVATE vxcore3)
  target_link_options(${name} PRIVATE -fsanitize=fuzzer)
  vx_target_options(${name})
  set_property(GLOBAL APPEND PROPERTY VX_FUZZERS ${name})
endfunction()

# vx_add_bench(NAME src...): a Google Benchmark executable.
function(vx_add_bench name)
  add_executable(${name} ${ARGN})
  target_link_libraries(${name} PRIVATE vxcore3 benchmark::benchmark PkgConfig::SQLITE3)
  vx_target_options(${name})
endfunction()

# vx_public_headers(h...): headers installed under include/vxcore3/.
function(vx_public_headers)
  foreach(h IN LISTS ARGN)
    set_property(GLOBAL APPEND PROPERTY VX_PUBLIC_HEADERS ${CMAKE_CURRENT_SOURCE_DIR}/${h})
  endforeach()
endfunction()
