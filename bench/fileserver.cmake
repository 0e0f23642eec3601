# The file-server benchmark host (driven by bench/fileserver-wrk.sh).
add_executable(fileserver_host ${CMAKE_CURRENT_SOURCE_DIR}/fileserver_host.cpp)
target_link_libraries(fileserver_host PRIVATE ksh_obj platform PkgConfig::EXPAT PkgConfig::CURL PkgConfig::SQLITE Threads::Threads)
