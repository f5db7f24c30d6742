/* A shared object to load. The linker gives it one symbol more, tavo_fixture_null, whose value is null. */
__attribute__((visibility("default"))) int tavo_fixture_answer(void) { return 42; }
