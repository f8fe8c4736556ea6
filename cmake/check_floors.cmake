# Holds every include list against the floors of the house: cmake -DSOURCE=DIR -P check_floors.cmake
#
# A room may include itself and the rooms named for it. The six rooms of the system may include nothing else but the standard library.

cmake_minimum_required(VERSION 3.25)

set(rooms_platform "platform")
set(rooms_common "platform;common")
set(rooms_acl "platform;common;acl")
set(rooms_providers "platform;common;providers")
set(rooms_service "platform;common;acl;providers;service")
set(rooms_daemon "platform;common;acl;providers;service;daemon")
set(rooms_platform/linux "platform;platform/linux")
set(rooms_platform/fake "platform;platform/fake")
set(rooms_sdk "platform;platform/linux/wire;platform/linux/base;sdk")
set(headers_sdk "common/DVErrorCodes.h;service/DVDaemon.h;service/DVAdministration.h;providers/_QXDocuvendVendor.h;providers/_QXDocuvendHostProtocol.h")
set(system_rooms platform common acl providers service daemon)

set(standard_headers
  algorithm any array atomic barrier bit bitset cassert cctype cerrno cfenv cfloat charconv chrono cinttypes climits clocale cmath codecvt
  compare complex concepts condition_variable coroutine csetjmp csignal cstdarg cstddef cstdint cstdio cstdlib cstring ctime cuchar cwchar
  cwctype deque exception execution filesystem forward_list fstream functional future initializer_list iomanip ios iosfwd iostream istream
  iterator latch limits list locale map memory memory_resource mutex new numbers numeric optional ostream queue random ranges ratio regex
  scoped_allocator semaphore set shared_mutex source_location span sstream stack stdexcept stop_token streambuf string string_view
  strstream syncstream system_error thread tuple type_traits typeindex typeinfo unordered_map unordered_set utility valarray variant
  vector version)

set(violations 0)
function(violation text)
  message(SEND_ERROR "${text}")
  math(EXPR count "${violations} + 1")
  set(violations ${count} PARENT_SCOPE)
endfunction()

# The room of a path: platform has two rooms beside it.
function(room_of path result)
  if(path MATCHES "^platform/(linux|fake)/")
    set(${result} "platform/${CMAKE_MATCH_1}" PARENT_SCOPE)
  elseif(path MATCHES "^([^/]+)/")
    set(${result} "${CMAKE_MATCH_1}" PARENT_SCOPE)
  else()
    set(${result} "" PARENT_SCOPE)
  endif()
endfunction()

file(GLOB_RECURSE files RELATIVE ${SOURCE}
  ${SOURCE}/platform/*.h ${SOURCE}/platform/*.cpp ${SOURCE}/common/* ${SOURCE}/acl/* ${SOURCE}/providers/* ${SOURCE}/service/*
  ${SOURCE}/daemon/* ${SOURCE}/sdk/*)
set(checked 0)
foreach(file IN LISTS files)
  if(NOT file MATCHES "\\.(h|cpp)$")
    continue()
  endif()
  math(EXPR checked "${checked} + 1")
  room_of(${file} room)
  if(NOT DEFINED rooms_${room})
    violation("${file}: in no room that the floors know")
    continue()
  endif()
  file(STRINGS ${SOURCE}/${file} includes REGEX "^[ \t]*#[ \t]*include")
  foreach(line IN LISTS includes)
    if(line MATCHES "\"([^\"]+)\"")
      set(header ${CMAKE_MATCH_1})
      room_of(${header} target)
      set(allowed FALSE)
      foreach(other IN LISTS rooms_${room})
        if(other STREQUAL target OR header MATCHES "^${other}/")
          # "platform" does not open the two rooms beside it.
          if(NOT (other STREQUAL "platform" AND NOT target STREQUAL "platform"))
            set(allowed TRUE)
          endif()
        endif()
      endforeach()
      if(header IN_LIST headers_${room})
        set(allowed TRUE)
      endif()
      # Only the entry point knows which platform is in use.
      if(file STREQUAL "daemon/main.cpp" AND target STREQUAL "platform/linux")
        set(allowed TRUE)
      endif()
      if(NOT allowed)
        violation("${file}: must not include \"${header}\"")
      elseif(NOT EXISTS ${SOURCE}/${header})
        violation("${file}: \"${header}\" does not name its folder")
      endif()
    elseif(line MATCHES "<([^>]+)>" AND room IN_LIST system_rooms)
      if(NOT CMAKE_MATCH_1 IN_LIST standard_headers)
        violation("${file}: <${CMAKE_MATCH_1}> is not the standard library's")
      endif()
    endif()
  endforeach()
endforeach()

if(checked EQUAL 0)
  message(FATAL_ERROR "no file was checked")
endif()
if(violations GREATER 0)
  message(FATAL_ERROR "${violations} includes point the wrong way")
endif()
message(STATUS "floors: ${checked} files, every include points downwards")
