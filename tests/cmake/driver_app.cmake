# The service that the process-level tests of the start-up and shut-down driver start.
add_executable(driver_app ${CMAKE_CURRENT_SOURCE_DIR}/programs/DriverApp.cpp)
target_link_libraries(driver_app PRIVATE QNSystem::QNSystem)
if(TARGET DriverProcessTest)
  add_dependencies(DriverProcessTest driver_app)
endif()
