# The real daemon over its real socket, used by clients that nobody here wrote.

add_library(faulty_disk MODULE ${CMAKE_CURRENT_SOURCE_DIR}/daemon/faulty_disk.cpp)
target_link_libraries(faulty_disk PRIVATE ${CMAKE_DL_LIBS})

foreach(name requests bad_input hostile neovim endurance drivers sinks configuration store_failures
    library halyardctl bridge export private_files idle_exit accounting consent)
  add_test(NAME daemon.${name}
    COMMAND ${HALYARD_PYTHON} ${CMAKE_CURRENT_SOURCE_DIR}/daemon/test_${name}.py)
  set_tests_properties(daemon.${name} PROPERTIES LABELS daemon TIMEOUT 600
    ENVIRONMENT "HALYARDD=$<TARGET_FILE:halyardd>;FAULTY_DISK_LIBRARY=$<TARGET_FILE:faulty_disk>;HALYARDCTL=$<TARGET_FILE:halyardctl>;HALYARD_EXPORT=$<TARGET_FILE:halyard-export>;OTLP_MODULES=${CMAKE_BINARY_DIR}/otlp/node_modules;HALYARD_PIPEWIRE=$<TARGET_FILE:halyard-pipewire>;GLITCH_PLAYER=$<TARGET_FILE:glitch_player>;EXAMPLE=$<TARGET_FILE:halyard_client_example>;PYTHONDONTWRITEBYTECODE=1")
endforeach()

# The books that `make torture` keeps, themselves.
add_test(NAME daemon.torture_checks
  COMMAND ${HALYARD_PYTHON} ${CMAKE_CURRENT_SOURCE_DIR}/torture/test_checks.py)
set_tests_properties(daemon.torture_checks PROPERTIES LABELS daemon TIMEOUT 120
  ENVIRONMENT "PYTHONDONTWRITEBYTECODE=1")
