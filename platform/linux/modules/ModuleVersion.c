/* Compiled into each module: the version of the service that it was built with. */
extern const char halvox_module_version[];
__attribute__((visibility("default"))) const char halvox_module_version[] = HALVOX_VERSION;
