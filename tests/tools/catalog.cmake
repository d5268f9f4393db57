# Tests of tools/orva-catalog, on real folders and real catalogs.
add_private_root_test(orva_catalog_test
  SOURCES ${CMAKE_CURRENT_LIST_DIR}/orva_catalog_test.cpp
  LIBS orva_catalog_lib test_program)
target_compile_definitions(orva_catalog_test PRIVATE
  ORVA_CATALOG_PROGRAM="$<TARGET_FILE:orva-catalog>"
  ORVA_CATALOG_VERSION="${PROJECT_VERSION}")
add_dependencies(orva_catalog_test orva-catalog)
