# Installs the build tree into a fresh prefix and imports the installed module from there, with nothing
# but its RPATH to find the installed libtessik. Run with cmake -P; inputs come in as -D:
#   BUILD_DIR   the project's build tree
#   PREFIX      install prefix to (re)create
#   MODULE_DIR  TESSIK_PYTHON_INSTALL_DIR (relative to the prefix)
#   PYTHON      the interpreter the module was built for
#   CONFIG      build configuration (may be empty)
cmake_minimum_required(VERSION 3.21)

foreach(required BUILD_DIR PREFIX MODULE_DIR PYTHON)
  if(NOT DEFINED ${required} OR "${${required}}" STREQUAL "")
    message(FATAL_ERROR "check_install.cmake needs -D${required}=...")
  endif()
endforeach()
if(IS_ABSOLUTE "${MODULE_DIR}")
  message(STATUS "TESSIK_PYTHON_INSTALL_DIR is absolute (${MODULE_DIR}); an install under a test prefix "
                 "would not contain it, so there is nothing to check")
  return()
endif()

set(config_args)
if(NOT "${CONFIG}" STREQUAL "")
  set(config_args --config "${CONFIG}")
endif()

file(REMOVE_RECURSE "${PREFIX}")
execute_process(COMMAND "${CMAKE_COMMAND}" --install "${BUILD_DIR}" --prefix "${PREFIX}" ${config_args}
  RESULT_VARIABLE result OUTPUT_QUIET)
if(NOT result EQUAL 0)
  message(FATAL_ERROR "install into ${PREFIX} failed (${result})")
endif()

# The loaded libtessik must be the installed one: a build-tree path would mean a stale RPATH.
set(probe [=[
import os, sys, tessik
prefix = os.path.realpath(sys.argv[1])
libs = {os.path.realpath(line.split()[-1]) for line in open("/proc/self/maps") if "libtessik" in line}
assert os.path.realpath(tessik.__file__).startswith(prefix), tessik.__file__
assert libs and all(p.startswith(prefix) for p in libs), libs
print("imported", tessik.__file__, "with", *sorted(libs))
]=])
execute_process(
  COMMAND "${CMAKE_COMMAND}" -E env --unset=LD_LIBRARY_PATH "PYTHONPATH=${PREFIX}/${MODULE_DIR}"
          "${PYTHON}" -c "${probe}" "${PREFIX}"
  # `python -c` puts the working directory first on sys.path; the build tree's module must not be there.
  WORKING_DIRECTORY "${PREFIX}"
  RESULT_VARIABLE result)
if(NOT result EQUAL 0)
  message(FATAL_ERROR "importing the installed module failed (${result})")
endif()
