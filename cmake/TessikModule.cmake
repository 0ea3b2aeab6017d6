# One OBJECT library per subsystem folder. The shared library `tessik` is assembled from
# these, and the tests link the same objects, so they exercise exactly what ships.
function(tessik_add_module name)
  add_library(${name} OBJECT ${ARGN})
  set_target_properties(${name} PROPERTIES
    POSITION_INDEPENDENT_CODE ON
    CXX_VISIBILITY_PRESET hidden
    VISIBILITY_INLINES_HIDDEN ON)
  target_compile_features(${name} PUBLIC cxx_std_17)
  # The objects end up inside libtessik, so they must see the export side of TESSIK_API.
  target_compile_definitions(${name} PRIVATE tessik_EXPORTS)
  target_include_directories(${name} PUBLIC
    ${PROJECT_SOURCE_DIR}/src
    ${PROJECT_SOURCE_DIR}/include
    ${PROJECT_BINARY_DIR}/include)
  target_link_libraries(${name} PRIVATE tessik::warnings PUBLIC tessik::sanitizers)
endfunction()
