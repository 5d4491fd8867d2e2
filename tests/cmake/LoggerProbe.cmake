# A small program whose log the logger tests inspect after it has exited, crashed or forked.
add_executable(LoggerProbe ${CMAKE_CURRENT_SOURCE_DIR}/programs/LoggerProbe.cpp)
target_link_libraries(LoggerProbe PRIVATE QNSystem::QNSystem)
