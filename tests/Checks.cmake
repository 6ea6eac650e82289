# What holds for the source tree itself, checked as tests.

# The system's own interpreter first: python3-msgpack belongs to it.
find_program(HALYARD_PYTHON python3 PATHS /usr/bin NO_DEFAULT_PATH)
find_program(HALYARD_PYTHON python3 REQUIRED)

function(halyard_check name)
  add_test(NAME house.${name} COMMAND ${ARGN} WORKING_DIRECTORY ${PROJECT_SOURCE_DIR})
  set_tests_properties(house.${name} PROPERTIES LABELS house TIMEOUT 120)
endfunction()

set(scripts ${PROJECT_SOURCE_DIR}/scripts)
halyard_check(format ${scripts}/check-format.sh)
halyard_check(includes ${HALYARD_PYTHON} ${scripts}/check-includes.py ${PROJECT_SOURCE_DIR})
halyard_check(includes_self_test ${HALYARD_PYTHON} ${scripts}/check-includes.py --self-test)
halyard_check(docs ${HALYARD_PYTHON} ${scripts}/check-docs.py ${PROJECT_SOURCE_DIR})
halyard_check(docs_self_test ${HALYARD_PYTHON} ${scripts}/check-docs.py --self-test)
halyard_check(mutate_self_test ${scripts}/mutate --self-test)
