# SensorServiceTest starts the example service and its client: build them with the test.
add_dependencies(SensorServiceTest qnsensord qnsensor-feed)
