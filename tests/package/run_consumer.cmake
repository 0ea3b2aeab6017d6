# Installs the build tree into a fresh prefix, then configures, builds and runs the consumer project
# against that prefix alone. Run with cmake -P; every input comes in as -D:
#   BUILD_DIR           the project's build tree (what `cmake --install` installs)
#   PREFIX              install prefix to (re)create
#   SOURCE_DIR          the consumer project
#   CONSUMER_BUILD_DIR  the consumer's build tree to (re)create
#   EXPECTED_VERSION    the version the package must report
#   CMAKE_CXX_COMPILER, CMAKE_GENERATOR, CMAKE_MAKE_PROGRAM, CONFIG  how to build the consumer
cmake_minimum_required(VERSION 3.21)

foreach(required BUILD_DIR PREFIX SOURCE_DIR CONSUMER_BUILD_DIR EXPECTED_VERSION CMAKE_GENERATOR)
  if(NOT DEFINED ${required} OR "${${required}}" STREQUAL "")
    message(FATAL_ERROR "run_consumer.cmake needs -D${required}=...")
  endif()
endforeach()

function(run_step name)
  execute_process(COMMAND ${ARGN} RESULT_VARIABLE result)
  if(NOT result EQUAL 0)
    string(JOIN " " command ${ARGN})
    message(FATAL_ERROR "${name} failed (${result}): ${command}")
  endif()
endfunction()

set(config_args)
if(NOT "${CONFIG}" STREQUAL "")
  set(config_args --config "${CONFIG}")
endif()

# Leftovers from an earlier run could hide a file the install no longer provides.
file(REMOVE_RECURSE "${PREFIX}" "${CONSUMER_BUILD_DIR}")
file(MAKE_DIRECTORY "${PREFIX}" "${CONSUMER_BUILD_DIR}")

run_step("install" "${CMAKE_COMMAND}" --install "${BUILD_DIR}" --prefix "${PREFIX}" ${config_args})

set(configure_args
  -S "${SOURCE_DIR}"
  -B "${CONSUMER_BUILD_DIR}"
  -G "${CMAKE_GENERATOR}"
  "-DCMAKE_PREFIX_PATH=${PREFIX}"
  "-DTESSIK_EXPECTED_PREFIX=${PREFIX}"
  "-DTESSIK_EXPECTED_VERSION=${EXPECTED_VERSION}"
  # Only the fresh prefix may satisfy find_package: no user or system package registry entries.
  -DCMAKE_FIND_USE_PACKAGE_REGISTRY=OFF
  -DCMAKE_FIND_USE_SYSTEM_PACKAGE_REGISTRY=OFF)
if(NOT "${CMAKE_CXX_COMPILER}" STREQUAL "")
  list(APPEND configure_args "-DCMAKE_CXX_COMPILER=${CMAKE_CXX_COMPILER}")
endif()
if(NOT "${CMAKE_MAKE_PROGRAM}" STREQUAL "")
  list(APPEND configure_args "-DCMAKE_MAKE_PROGRAM=${CMAKE_MAKE_PROGRAM}")
endif()
if(NOT "${CONFIG}" STREQUAL "")
  list(APPEND configure_args "-DCMAKE_BUILD_TYPE=${CONFIG}")
endif()
run_step("consumer configure" "${CMAKE_COMMAND}" ${configure_args})
run_step("consumer build" "${CMAKE_COMMAND}" --build "${CONSUMER_BUILD_DIR}" ${config_args})

set(consumer_candidates "${CONSUMER_BUILD_DIR}/consumer")
if(NOT "${CONFIG}" STREQUAL "")
  list(PREPEND consumer_candidates "${CONSUMER_BUILD_DIR}/${CONFIG}/consumer")
endif()
set(consumer "")
foreach(candidate IN LISTS consumer_candidates)
  if(EXISTS "${candidate}")
    set(consumer "${candidate}")
    break()
  endif()
endforeach()
if(consumer STREQUAL "")
  message(FATAL_ERROR "consumer executable not found in ${CONSUMER_BUILD_DIR}")
endif()

# The consumer must find the installed libtessik through the run path its build recorded; a library
# path from the environment could hide a package that does not work on its own.
unset(ENV{LD_LIBRARY_PATH})
run_step("consumer run" "${consumer}")
