# Fails if the library needs other libraries than those of the C library.
execute_process(COMMAND ${READELF} --dynamic --wide ${LIBRARY}
  OUTPUT_VARIABLE dynamic COMMAND_ERROR_IS_FATAL ANY)
string(REGEX MATCHALL "Shared library: \\[[^]]*\\]" needed "${dynamic}")
if(NOT needed)
  message(FATAL_ERROR "no needed library found: readelf printed\n${dynamic}")
endif()
foreach(library IN LISTS needed)
  if(NOT library MATCHES "\\[(libc|libm|ld-linux[-_a-z0-9]*)\\.so")
    message(FATAL_ERROR "${LIBRARY}: ${library}; expected the C library only")
  endif()
endforeach()
