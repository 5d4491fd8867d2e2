# Helper programs of the instance-manager and daemon tests: each is a real process that holds,
# stops or probes an instance, so the tests need no mocked files or signals.
add_executable(qn_instance_tool ${CMAKE_CURRENT_SOURCE_DIR}/programs/InstanceTool.cpp)
target_link_libraries(qn_instance_tool PRIVATE QNSystem::QNSystem)
target_include_directories(qn_instance_tool PRIVATE ${CMAKE_CURRENT_SOURCE_DIR})

add_executable(qn_daemon_probe ${CMAKE_CURRENT_SOURCE_DIR}/programs/DaemonProbe.cpp)
target_link_libraries(qn_daemon_probe PRIVATE QNSystem::QNSystem)
target_include_directories(qn_daemon_probe PRIVATE ${CMAKE_CURRENT_SOURCE_DIR})

if(TARGET ProcessInstanceManagerTest)
  add_dependencies(ProcessInstanceManagerTest qn_instance_tool)
endif()
if(TARGET SystemDaemonTest)
  add_dependencies(SystemDaemonTest qn_daemon_probe)
endif()
