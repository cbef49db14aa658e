# The platform: every operation that the module calls, for an ordinary Linux machine.
file(GLOB NAS_SOURCES CONFIGURE_DEPENDS nas/*/*.cpp)
add_library(arbory_nas SHARED ${NAS_SOURCES})
set_target_properties(arbory_nas PROPERTIES LINKER_LANGUAGE CXX)
# Its loops take many values at a time, which at -O2 this compiler does for few of them.
set_source_files_properties(nas/search/index_ranges.cpp PROPERTIES COMPILE_OPTIONS -O3)
target_link_libraries(
  arbory_nas
  PUBLIC PkgConfig::JSONCPP
  PRIVATE PkgConfig::SQLITE PkgConfig::UCHARDET PkgConfig::UTF8PROC PkgConfig::PCRE2 PkgConfig::ACL PkgConfig::TOML
          PkgConfig::XXHASH
          Threads::Threads ${CMAKE_DL_LIBS})

# What only machines of a fleet load.
pkg_check_modules(SODIUM REQUIRED IMPORTED_TARGET libsodium)
pkg_check_modules(CURL REQUIRED IMPORTED_TARGET libcurl)
file(GLOB FLEET_SOURCES CONFIGURE_DEPENDS nas/fleet/plugin/*.cpp)
add_library(arbory_fleet MODULE ${FLEET_SOURCES})
set_target_properties(arbory_fleet PROPERTIES LINKER_LANGUAGE CXX CXX_VISIBILITY_PRESET hidden)
target_link_libraries(arbory_fleet PRIVATE PkgConfig::SODIUM PkgConfig::CURL)
