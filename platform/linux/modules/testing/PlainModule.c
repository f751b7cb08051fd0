/* A module for the tests of the loader. */
int halvox_plain_module_2(void);
__attribute__((visibility("default"))) int halvox_plain_module_2(void) { return 42; }
