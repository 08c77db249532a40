# GoogleTest: the host build uses Debian's packaged library; the Windows cross build
# compiles the sources Debian ships under /usr/src/googletest with the cross compiler.
if(CMAKE_CROSSCOMPILING)
  set(gtest_force_shared_crt OFF CACHE BOOL "" FORCE)
  set(BUILD_GMOCK ON CACHE BOOL "" FORCE)
  set(INSTALL_GTEST OFF CACHE BOOL "" FORCE)
  # GoogleTest's own sources do not build warning-free with every compiler; they are not ours.
  set(_lb_saved_options "${CMAKE_CXX_FLAGS}")
  add_subdirectory(/usr/src/googletest ${CMAKE_BINARY_DIR}/googletest EXCLUDE_FROM_ALL)
  foreach(t gtest gtest_main gmock gmock_main)
    target_compile_options(${t} PRIVATE -Wno-error)
  endforeach()
  # GoogleTest 1.12 defines the GTest:: aliases itself.
else()
  find_package(GTest REQUIRED)
  if(NOT TARGET GTest::gmock)
    find_library(LB_GMOCK_LIB gmock REQUIRED)
    add_library(GTest::gmock UNKNOWN IMPORTED)
    set_target_properties(GTest::gmock PROPERTIES IMPORTED_LOCATION ${LB_GMOCK_LIB})
  endif()
endif()
include(GoogleTest)

# lb_add_test(name SOURCES... LIBS ...): one test executable, one CTest entry.
function(lb_add_test name)
  cmake_parse_arguments(T "" "" "SOURCES;LIBS" ${ARGN})
  add_executable(${name} ${T_SOURCES})
  target_link_libraries(${name} PRIVATE ${T_LIBS} GTest::gmock GTest::gtest_main Threads::Threads)
  add_test(NAME ${name} COMMAND ${name})
  if(CMAKE_CROSSCOMPILING)
    set(_lb_timeout 180)
  else()
    set(_lb_timeout 600)
  endif()
  set_tests_properties(${name} PROPERTIES TIMEOUT ${_lb_timeout}
    ENVIRONMENT "WINEDEBUG=-all;TSAN_OPTIONS=halt_on_error=1:second_deadlock_stack=1;ASAN_OPTIONS=detect_leaks=1:halt_on_error=1;UBSAN_OPTIONS=halt_on_error=1:print_stacktrace=1")
endfunction()
