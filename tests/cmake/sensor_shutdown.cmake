# SensorShutdownTest starts the example service: build it with the test.
add_dependencies(SensorShutdownTest qnsensord)
