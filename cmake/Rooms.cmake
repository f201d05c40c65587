# A room is a folder with one responsibility. It is built as one target and may use only the rooms that it names:
#
#   kvr_room(core/followup                the folder, below src or below the project
#     USES core/scheduling platform/log   the rooms whose headers it includes and whose code it links
#     SYSTEM <openssl/evp.h>              the headers of the system and of libraries that it includes; headers of the
#                                         C++ library that do not reach outside the process need no entry
#     LINKS OpenSSL::Crypto               libraries outside the project
#     WITHOUT Module.cpp)                 files of the folder that this target does not build
#
#   kvr_program(kvrctl client/kvrctl [FILE...] USES ...)          the same, as an executable
#   kvr_module(kvragent-http local/http [FILE...] USES ...)       the same, as a library that is loaded at run time
#   kvr_tests(tests/unit/followup USES ...)                       the same, as objects of a test program
#
# A room can use only rooms that are declared before it, so there are no circles.
# scripts/check-layers reads these calls and checks every include of the tree against them.

# Parses such a call: sets `sources` to the files to build and `used` to the targets of the rooms.
macro(kvr_parse folder)
  cmake_parse_arguments(ROOM "" "" "USES;SYSTEM;LINKS;WITHOUT" ${ARGN})
  set(path ${PROJECT_SOURCE_DIR}/${folder})
  if(EXISTS ${PROJECT_SOURCE_DIR}/src/${folder})
    set(path ${PROJECT_SOURCE_DIR}/src/${folder})
  endif()
  set(sources)
  foreach(file ${ROOM_UNPARSED_ARGUMENTS})
    list(APPEND sources ${path}/${file})
  endforeach()
  if(NOT sources)
    file(GLOB sources CONFIGURE_DEPENDS ${path}/*.cpp)
  endif()
  foreach(file ${ROOM_WITHOUT})
    list(REMOVE_ITEM sources ${path}/${file})
  endforeach()
  set(used)
  foreach(room ${ROOM_USES})
    string(MAKE_C_IDENTIFIER kvr_${room} room_target)
    if(NOT TARGET ${room_target})
      message(FATAL_ERROR "${folder} uses ${room}, which is not declared above it")
    endif()
    list(APPEND used ${room_target})
  endforeach()
endmacro()

function(kvr_room folder)
  kvr_parse(${folder} ${ARGN})
  string(MAKE_C_IDENTIFIER kvr_${folder} target)
  if(sources)
    add_library(${target} STATIC ${sources})
    set(scope PUBLIC)
  else()
    add_library(${target} INTERFACE)
    set(scope INTERFACE)
  endif()
  target_include_directories(${target} ${scope} ${PROJECT_SOURCE_DIR}/src)
  target_link_libraries(${target} ${scope} ${used} ${ROOM_LINKS})
endfunction()

function(kvr_program name folder)
  kvr_parse(${folder} ${ARGN})
  add_executable(${name} ${sources})
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR}/src)
  target_link_libraries(${name} PRIVATE ${used} ${ROOM_LINKS})
endfunction()

function(kvr_module name folder)
  kvr_parse(${folder} ${ARGN})
  add_library(${name} MODULE ${sources})
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR}/src)
  target_link_libraries(${name} PRIVATE ${used} ${ROOM_LINKS})
endfunction()
