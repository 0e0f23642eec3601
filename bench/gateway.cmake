# The reference host of the gateway load benchmark (bench/gateway-wrk.sh).
add_executable(kdh1_fixed_host ${CMAKE_CURRENT_SOURCE_DIR}/kdh1_fixed_host.cpp)
target_link_libraries(kdh1_fixed_host PRIVATE platform Threads::Threads)
