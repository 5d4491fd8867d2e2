# QnsensordCommandLineTest starts the example service: build it with the test.
add_dependencies(QnsensordCommandLineTest qnsensord)
