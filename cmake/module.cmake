# The plug-in module and the objects it is made of. The objects are a target of their own so that
# the module's tests can link them against a scripted platform instead of the real one.
file(GLOB MODULE_SOURCES CONFIGURE_DEPENDS module/*.cpp api/*.cpp search/*.cpp history/*.cpp)
if(NOT MODULE_SOURCES)
  return()
endif()
add_library(module_objects OBJECT ${MODULE_SOURCES})
target_link_libraries(module_objects PUBLIC PkgConfig::JSONCPP)

add_library(arbory_module MODULE $<TARGET_OBJECTS:module_objects>)
set_target_properties(arbory_module PROPERTIES PREFIX "" OUTPUT_NAME "NUVA.Arbory.Search")
target_link_libraries(arbory_module PRIVATE arbory_nas PkgConfig::JSONCPP)
# Servers look up one symbol; everything else, template instances included, stays private.
set(MODULE_EXPORTS ${CMAKE_SOURCE_DIR}/module/module.map)
target_link_options(arbory_module PRIVATE -Wl,--version-script=${MODULE_EXPORTS})
set_target_properties(arbory_module PROPERTIES LINK_DEPENDS ${MODULE_EXPORTS})
if(NOT ARBORY_SANITIZE AND NOT ARBORY_FUZZ)
  target_link_options(arbory_module PRIVATE -Wl,--no-undefined)
endif()
