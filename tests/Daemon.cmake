# The real daemon over its real socket, used by clients that nobody here wrote.

foreach(name requests bad_input neovim endurance drivers sinks configuration store_failures
    library halyardctl bridge private_files idle_exit accounting)
  add_test(NAME daemon.${name}
    COMMAND ${HALYARD_PYTHON} ${CMAKE_CURRENT_SOURCE_DIR}/daemon/test_${name}.py)
  set_tests_properties(daemon.${name} PROPERTIES LABELS daemon TIMEOUT 600
    ENVIRONMENT "HALYARDD=$<TARGET_FILE:halyardd>;HALYARDCTL=$<TARGET_FILE:halyardctl>;HALYARD_PIPEWIRE=$<TARGET_FILE:halyard-pipewire>;GLITCH_PLAYER=$<TARGET_FILE:glitch_player>;EXAMPLE=$<TARGET_FILE:halyard_client_example>;PYTHONDONTWRITEBYTECODE=1")
endforeach()
