# The report's page in a browser, where one is installed. `make test` puts axe-core, at
# the version of tests/report/package-lock.json, below the build folder.
add_test(NAME report.page
  COMMAND ${HALYARD_PYTHON} ${CMAKE_CURRENT_SOURCE_DIR}/report/test_page.py)
set_tests_properties(report.page PROPERTIES LABELS report TIMEOUT 300 SKIP_RETURN_CODE 77
  ENVIRONMENT "HALYARDD=$<TARGET_FILE:halyardd>;HALYARDCTL=$<TARGET_FILE:halyardctl>;AXE_CORE=${PROJECT_BINARY_DIR}/axe/node_modules/axe-core/axe.min.js;PYTHONDONTWRITEBYTECODE=1")
