# Where everything goes below the prefix. The program finds the library, the module, the page and the
# sample share by its own place.
install(TARGETS arbory RUNTIME DESTINATION bin)
install(TARGETS arbory_nas arbory_fleet arbory_server LIBRARY DESTINATION lib/arbory)
if(TARGET arbory_module)
  install(TARGETS arbory_module LIBRARY DESTINATION lib/arbory)
endif()
install(DIRECTORY web/dist/ DESTINATION share/arbory/web OPTIONAL)
install(DIRECTORY packaging/sample DESTINATION share/arbory)
install(FILES packaging/arbory.service packaging/arbory-index.service DESTINATION lib/systemd/system)
install(DIRECTORY ${CMAKE_BINARY_DIR}/manual/ DESTINATION share PATTERN made EXCLUDE)
install(FILES docs/api.md docs/deploy.md docs/fleet.md docs/http.md docs/index.md docs/query.md
        DESTINATION share/doc/arbory)
install(FILES packaging/arbory.toml packaging/nginx.conf DESTINATION share/doc/arbory/examples)
install(DIRECTORY packaging/fleet DESTINATION share/doc/arbory/examples USE_SOURCE_PERMISSIONS)
install(FILES packaging/pam/arbory DESTINATION share/doc/arbory/examples/pam)
