# Consumer tests: the library installed into a prefix in the build tree and used from outside the
# tree through find_package, pkg-config and add_subdirectory (tests/consumer/run.sh). The install
# runs first, as the fixture of the tests that use the prefix.
foreach(lMode install package pkg-config subdirectory newcomer)
  add_test(NAME Consumer.${lMode}
    COMMAND ${CMAKE_CURRENT_SOURCE_DIR}/consumer/run.sh ${lMode} ${PROJECT_SOURCE_DIR} ${PROJECT_BINARY_DIR}
      ${CMAKE_CURRENT_BINARY_DIR}/consumer ${CMAKE_CXX_COMPILER} "${CMAKE_CXX_FLAGS}" ${CMAKE_BUILD_TYPE})
endforeach()
set_tests_properties(Consumer.install PROPERTIES FIXTURES_SETUP QNConsumerPrefix TIMEOUT 120)
set_tests_properties(Consumer.package Consumer.pkg-config Consumer.newcomer PROPERTIES
  FIXTURES_REQUIRED QNConsumerPrefix TIMEOUT 300)
# Builds the whole library once more, inside the consuming project.
set_tests_properties(Consumer.subdirectory PROPERTIES TIMEOUT 900)
