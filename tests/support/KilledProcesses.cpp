// For the tests that end a simulated daemon as a kill does: its queues never run again, so what a running daemon lets
// go of in their jobs (sessions and their connections, helpers and their URL sessions hold each other until then) is
// left behind, as in a real kill. The leak check cannot tell that from a leak, and is switched off for these programs
// alone.
extern "C" __attribute__((visibility("default"))) const char* __lsan_default_suppressions();
extern "C" const char* __lsan_default_suppressions() { return "leak:telvane_daemon_test\nleak:telvane_tools_test\n"; }
