# What every target of this project shares.

option(DOCUVEND_TESTS "Build the tests and the platform's fakes" ON)
set(DOCUVEND_SANITIZE "" CACHE STRING "Sanitizers for the whole build, as -fsanitize takes them")

set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_EXPORT_COMPILE_COMMANDS ON)
set(CMAKE_RUNTIME_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/bin)

add_compile_options(-Wall -Wextra -Wpedantic -Werror)
if(DOCUVEND_SANITIZE)
  add_compile_options(-fsanitize=${DOCUVEND_SANITIZE} -fno-omit-frame-pointer -fno-sanitize-recover=all)
  add_link_options(-fsanitize=${DOCUVEND_SANITIZE})
endif()

find_package(Threads REQUIRED)
find_package(EXPAT REQUIRED)
find_package(PkgConfig REQUIRED)
pkg_check_modules(SODIUM REQUIRED IMPORTED_TARGET libsodium)

# docuvend_room(NAME [DEPS target...]): the library docuvend_NAME of all sources in this folder (not below it).
function(docuvend_room name)
  cmake_parse_arguments(ROOM "" "" "DEPS" ${ARGN})
  file(GLOB sources CONFIGURE_DEPENDS *.cpp)
  list(FILTER sources EXCLUDE REGEX "/main\\.cpp$")
  if(sources)
    add_library(docuvend_${name} STATIC ${sources})
    target_include_directories(docuvend_${name} PUBLIC ${CMAKE_SOURCE_DIR})
    target_link_libraries(docuvend_${name} PUBLIC ${ROOM_DEPS} Threads::Threads)
  else()
    add_library(docuvend_${name} INTERFACE)
    target_include_directories(docuvend_${name} INTERFACE ${CMAKE_SOURCE_DIR})
    target_link_libraries(docuvend_${name} INTERFACE ${ROOM_DEPS} Threads::Threads)
  endif()
endfunction()

# docuvend_tests(NAME [DEPS target...] [NEEDS target...]): the program NAME_tests of all *_test.cpp in this folder, each test a process of its
# own. NEEDS are programs that the tests start.
function(docuvend_tests name)
  cmake_parse_arguments(TESTS "" "" "DEPS;NEEDS" ${ARGN})
  file(GLOB sources CONFIGURE_DEPENDS *.cpp)
  add_executable(${name}_tests ${sources})
  target_include_directories(${name}_tests PRIVATE ${CMAKE_SOURCE_DIR})
  target_link_libraries(${name}_tests PRIVATE ${TESTS_DEPS} GTest::gmock GTest::gtest_main)
  target_compile_definitions(${name}_tests PRIVATE DOCUVEND_BIN="${CMAKE_RUNTIME_OUTPUT_DIRECTORY}")
  if(TESTS_NEEDS)
    add_dependencies(${name}_tests ${TESTS_NEEDS})
  endif()
  gtest_discover_tests(${name}_tests TEST_PREFIX "${name}." PROPERTIES TIMEOUT 120 DISCOVERY_TIMEOUT 60)
endfunction()
