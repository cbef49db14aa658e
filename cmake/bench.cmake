# What scripts/bench runs beside the program itself.
find_package(benchmark REQUIRED)
add_executable(make_tree bench/make_tree.cpp)
add_executable(floor bench/floor.cpp)
target_link_libraries(floor PRIVATE Threads::Threads)
add_executable(service bench/service.cpp)
target_link_libraries(service PRIVATE arbory_nas)
add_executable(micro bench/micro.cpp)
target_link_libraries(micro PRIVATE arbory_nas benchmark::benchmark)
