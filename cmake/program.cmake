# The `arbory` program. All but its main function is a target of its own, so that tests can link it.
file(GLOB PROGRAM_SOURCES CONFIGURE_DEPENDS arbory/*.cpp)
list(FILTER PROGRAM_SOURCES EXCLUDE REGEX "/main\\.cpp$")
add_library(program_objects OBJECT ${PROGRAM_SOURCES})
target_link_libraries(program_objects PUBLIC arbory_nas PkgConfig::JSONCPP)

add_executable(arbory arbory/main.cpp)
target_compile_definitions(arbory PRIVATE ARBORY_VERSION="${PROJECT_VERSION}")
target_link_libraries(arbory PRIVATE program_objects Threads::Threads)
