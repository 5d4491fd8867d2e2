# SensorSecurityTest starts the example service and its client: build them with the test.
add_dependencies(SensorSecurityTest qnsensord qnsensor-feed)
