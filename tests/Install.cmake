# What an installation holds, and whether others can use it.

if(NOT HALYARD_SANITIZE) # Nobody installs those, and their library wants its runtime.
  foreach(name files library packages units help)
    add_test(NAME install.${name}
      COMMAND ${HALYARD_PYTHON} ${CMAKE_CURRENT_SOURCE_DIR}/install/test_${name}.py)
    set_tests_properties(install.${name} PROPERTIES LABELS install TIMEOUT 600
      ENVIRONMENT "BUILD=${CMAKE_BINARY_DIR};PREFIX=${CMAKE_INSTALL_PREFIX};LIBDIR=${CMAKE_INSTALL_LIBDIR};HALYARDD=$<TARGET_FILE:halyardd>;PYTHONDONTWRITEBYTECODE=1")
  endforeach()
endif()
