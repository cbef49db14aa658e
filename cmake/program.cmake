# The `arbory` program.
file(GLOB PROGRAM_SOURCES CONFIGURE_DEPENDS arbory/*.cpp)
if(NOT PROGRAM_SOURCES)
  return()
endif()
add_executable(arbory ${PROGRAM_SOURCES})
target_link_libraries(arbory PRIVATE arbory_nas PkgConfig::JSONCPP Threads::Threads)
