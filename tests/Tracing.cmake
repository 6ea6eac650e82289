# Traces of a real program through the real daemon, where the system lets us.

pkg_check_modules(SNDFILE REQUIRED IMPORTED_TARGET sndfile)

add_executable(traced_work tracing/traced_work.cpp tracing/Sound.cpp)
target_link_libraries(traced_work PRIVATE halyard_options halyard Threads::Threads
  PkgConfig::SNDFILE)

add_test(NAME daemon.tracing
  COMMAND ${HALYARD_PYTHON} ${CMAKE_CURRENT_SOURCE_DIR}/daemon/test_tracing.py)
set_tests_properties(daemon.tracing PROPERTIES LABELS "daemon;tracing" TIMEOUT 600
  RUN_SERIAL TRUE # It compares times.
  ENVIRONMENT "HALYARDD=$<TARGET_FILE:halyardd>;TRACED_WORK=$<TARGET_FILE:traced_work>;LIBHALYARD=$<TARGET_FILE:halyard>;PYTHONDONTWRITEBYTECODE=1")
