# The one helper program that the process-level tests start (tests/programs/TestHelper.cpp), and
# the example programs some tests start: build them with the tests.
add_executable(qn_test_helper ${CMAKE_CURRENT_SOURCE_DIR}/programs/TestHelper.cpp)
target_link_libraries(qn_test_helper PRIVATE QNSystem::QNSystem)
target_include_directories(qn_test_helper PRIVATE ${CMAKE_CURRENT_SOURCE_DIR}/support)
foreach(lTest ProcessTest DriverProcessTest LoggerTest)
  if(TARGET ${lTest})
    add_dependencies(${lTest} qn_test_helper)
  endif()
endforeach()
if(TARGET QnsensordTest)
  add_dependencies(QnsensordTest qnsensord qnsensor-feed)
endif()
