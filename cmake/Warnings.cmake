# Every target of the project takes these: warnings are errors with gcc and clang, and clang checks the queues.
add_library(extora_options INTERFACE)
target_include_directories(extora_options INTERFACE $<BUILD_INTERFACE:${CMAKE_SOURCE_DIR}>)
target_compile_definitions(extora_options INTERFACE MSGPACK_NO_BOOST)
target_compile_options(extora_options INTERFACE
  $<BUILD_INTERFACE:-Wall;-Wextra;-Wpedantic;-Wshadow;-Wnon-virtual-dtor;-Woverloaded-virtual;-Wcast-qual;-Werror>)
if(CMAKE_CXX_COMPILER_ID MATCHES "Clang")
  target_compile_options(extora_options INTERFACE $<BUILD_INTERFACE:-Wthread-safety;-Wthread-safety-beta>)
endif()
if(EXTORA_SANITIZE)
  add_compile_options(-fsanitize=${EXTORA_SANITIZE} -fno-omit-frame-pointer -fno-sanitize-recover=all)
  add_link_options(-fsanitize=${EXTORA_SANITIZE})
endif()
