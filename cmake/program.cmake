# The `arbory` program. All but its main function is a target of its own, so that tests can link it.
file(GLOB PROGRAM_SOURCES CONFIGURE_DEPENDS arbory/*.cpp arbory/server/*/*.cpp)
list(FILTER PROGRAM_SOURCES EXCLUDE REGEX "/main\\.cpp$|/server/plugin/")
add_library(program_objects OBJECT ${PROGRAM_SOURCES})
target_link_libraries(program_objects PUBLIC arbory_nas PkgConfig::JSONCPP PkgConfig::ZLIB
                                             Threads::Threads)
# What is not installed beside the program is looked for in the tree that it was built from.
set(ARBORY_TREE ${CMAKE_SOURCE_DIR})
if(ARBORY_PACKAGE)
  set(ARBORY_TREE /usr/share/arbory)
endif()
target_compile_definitions(program_objects PRIVATE ARBORY_VERSION="${PROJECT_VERSION}"
                           ARBORY_SOURCE_DIR="${ARBORY_TREE}")
# Half of the time these take to compile is the optimiser's, which gains nothing there: they wait
# for clients.
set_source_files_properties(arbory/server/transport/connection.cpp arbory/server/transport/http_server.cpp
                            arbory/server/transport/child_pipe.cpp PROPERTIES COMPILE_OPTIONS "-O1")

add_executable(arbory arbory/main.cpp)
target_compile_definitions(arbory PRIVATE ARBORY_VERSION="${PROJECT_VERSION}")
target_link_libraries(arbory PRIVATE program_objects Threads::Threads)

# What only a server's children load.
file(GLOB SERVER_SOURCES CONFIGURE_DEPENDS arbory/server/plugin/*.cpp)
add_library(arbory_server MODULE ${SERVER_SOURCES} arbory/server/transport/http_text.cpp)
set_target_properties(arbory_server PROPERTIES LINKER_LANGUAGE CXX CXX_VISIBILITY_PRESET hidden)
target_link_libraries(arbory_server PRIVATE PkgConfig::JSONCPP PkgConfig::PAM PkgConfig::ARCHIVE)
add_dependencies(arbory arbory_server)

# The manual pages and the completions, which the program writes about itself. When it is built for
# another machine than this, CMAKE_CROSSCOMPILING_EMULATOR says what it runs with.
set(MANUAL_FOLDER ${CMAKE_BINARY_DIR}/manual)
set(CONFIGURATION_SAMPLE ${CMAKE_SOURCE_DIR}/packaging/arbory.toml)
string(TIMESTAMP TODAY "%Y-%m-%d" UTC)
add_custom_command(OUTPUT ${MANUAL_FOLDER}/made
                   COMMAND arbory generate ${MANUAL_FOLDER} ${TODAY} ${CONFIGURATION_SAMPLE}
                   COMMAND ${CMAKE_COMMAND} -E touch ${MANUAL_FOLDER}/made
                   DEPENDS arbory ${CONFIGURATION_SAMPLE}
                   VERBATIM)
add_custom_target(manual ALL DEPENDS ${MANUAL_FOLDER}/made)
