# Tests of tools/zophotos: the real program on databases that the real daemon made.
find_package(nlohmann_json 3.11 REQUIRED)
add_private_root_test(zophotos_test
  SOURCES
    ${CMAKE_SOURCE_DIR}/tests/hostile/CraftedDatabase.cpp
    ${CMAKE_SOURCE_DIR}/tests/hostile/CraftedLog.cpp
    ${CMAKE_CURRENT_LIST_DIR}/ZophotosTest.cpp
    ${CMAKE_CURRENT_LIST_DIR}/zophotos_check_test.cpp
    ${CMAKE_CURRENT_LIST_DIR}/zophotos_concurrency_test.cpp
    ${CMAKE_CURRENT_LIST_DIR}/zophotos_failure_test.cpp
    ${CMAKE_CURRENT_LIST_DIR}/zophotos_hostile_test.cpp
    ${CMAKE_CURRENT_LIST_DIR}/zophotos_test.cpp
  LIBS appliance nlohmann_json::nlohmann_json test_program
  LABELS system)
target_compile_definitions(zophotos_test PRIVATE
  ZOPHOTOS="$<TARGET_FILE:zophotos>"
  ZOPHOTOS_VERSION="${PROJECT_VERSION}")
add_dependencies(zophotos_test zophotos)
