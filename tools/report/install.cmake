# cmake -DNPM=<npm> -DSOURCE=<this directory> -DWORK=<directory> -P install.cmake
# Installs the libraries of the page into WORK/node_modules, as the lock file says. Runs none of their
# scripts.
file(MAKE_DIRECTORY ${WORK})
foreach(name package.json package-lock.json .npmrc)
  file(COPY_FILE ${SOURCE}/${name} ${WORK}/${name})
endforeach()
execute_process(
  COMMAND ${NPM} ci --prefer-offline --ignore-scripts --no-audit --no-fund --loglevel=error
  WORKING_DIRECTORY ${WORK} RESULT_VARIABLE status OUTPUT_VARIABLE output ERROR_VARIABLE output)
if(NOT status EQUAL 0)
  # npm says what failed, but not what to do about it.
  message(FATAL_ERROR
    "npm cannot install the libraries for the page of halvoxctl report. It needs its registry, or a "
    "cache that has them. To build without the page, configure with -DHALVOX_REPORT=OFF.\n${output}")
endif()
file(TOUCH ${WORK}/installed)
