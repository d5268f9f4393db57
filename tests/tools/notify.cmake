# Tests of tools/orva-notify: the real program on real sockets and real mounts.
add_private_root_test(orva_notify_test
  SOURCES ${CMAKE_CURRENT_LIST_DIR}/orva_notify_test.cpp
  LIBS orva_notify_lib test_program)
target_compile_definitions(orva_notify_test PRIVATE
  ORVA_NOTIFY_PROGRAM="$<TARGET_FILE:orva-notify>"
  ORVA_NOTIFY_VERSION="${PROJECT_VERSION}")
add_dependencies(orva_notify_test orva-notify)
