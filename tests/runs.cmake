# What CTest runs. A tree runs its own programs; the tree of the preset dev runs those of the other presets as
# well, which a fixture builds first. results/ gets the reports of the tests that hold several, for
# scripts/totals.

set(python /usr/bin/python3)
set(results ${CMAKE_BINARY_DIR}/results)

# Words that the functions below take:
#   LABELS l...   PATHS path...   COMMAND word...   ENV VARIABLE=value...   UNDER word... (put in front)
#   MORE program... (unit test programs beside the usual)
#   PARTS n (so many that run side by side)   TREE folder (whose programs are tested; default: this one)
#   COST seconds (the longest are started first)   NEEDS fixture...   LOCK name   PROCESSORS n
macro(orvpatch_words)
  cmake_parse_arguments(run "" "COST;LOCK;PARTS;PROCESSORS;TREE" "COMMAND;ENV;LABELS;MORE;NEEDS;PATHS;UNDER" ${ARGN})
  foreach(default COST=5 PARTS=1 PROCESSORS=1 TREE=${CMAKE_BINARY_DIR})
    string(REGEX MATCH "^([A-Z]+)=(.*)$" matched "${default}")
    if(NOT DEFINED run_${CMAKE_MATCH_1})
      set(run_${CMAKE_MATCH_1} ${CMAKE_MATCH_2})
    endif()
  endforeach()
endmacro()

# orvpatch_add(NAME COMMAND...): with the words that the caller was given.
function(orvpatch_add name)
  add_test(NAME ${name} COMMAND ${run_UNDER} ${ARGN} WORKING_DIRECTORY ${PROJECT_SOURCE_DIR})
  set_tests_properties(${name} PROPERTIES LABELS "${run_LABELS}" COST ${run_COST} TIMEOUT 1500
    PROCESSORS ${run_PROCESSORS} FIXTURES_REQUIRED "${run_NEEDS}" RESOURCE_LOCK "${run_LOCK}"
    ENVIRONMENT "${run_ENV}" SKIP_RETURN_CODE 77)
endfunction()

# orvpatch_test(NAME ...): one test.
function(orvpatch_test name)
  orvpatch_words(${ARGN})
  orvpatch_add(${name} ${run_COMMAND})
endfunction()

# orvpatch_build(PRESET ...): the fixture of this name, a tree of this preset.
function(orvpatch_build preset)
  orvpatch_words(${ARGN} PROCESSORS 2 COST 1000)
  orvpatch_add(build.${preset} ${CMAKE_COMMAND} --workflow --preset ${preset})
  set_tests_properties(build.${preset} PROPERTIES FIXTURES_SETUP ${preset} TIMEOUT 5400)
endfunction()

# orvpatch_pytest(NAME ...): the Python tests below these paths of tests/.
function(orvpatch_pytest name)
  orvpatch_words(${ARGN})
  list(TRANSFORM run_PATHS PREPEND tests/)
  list(APPEND run_ENV ORVPATCH=${run_TREE}/orvpatch)
  foreach(part RANGE 1 ${run_PARTS})
    set(part_name ${name})
    if(run_PARTS GREATER 1)
      string(APPEND part_name .${part})
    endif()
    orvpatch_add(${part_name} ${python} -m pytest -q -c tests/pytest.ini --rootdir tests
      --part=${part}/${run_PARTS} --junitxml=${results}/${part_name}.xml ${run_PATHS})
  endforeach()
endfunction()

# orvpatch_units(NAME ...): the unit test programs of a tree, each in a process of its own, or in some.
function(orvpatch_units name)
  orvpatch_words(${ARGN})
  set(common_env ${run_ENV})
  foreach(part RANGE 1 ${run_PARTS})
    math(EXPR index "${part} - 1")
    set(run_ENV ${common_env} GTEST_TOTAL_SHARDS=${run_PARTS} GTEST_SHARD_INDEX=${index})
    orvpatch_add(${name}.unit.${part} ${run_TREE}/tests/unit_tests --gtest_brief=1
      --gtest_output=xml:${results}/${name}.unit.${part}.xml)
  endforeach()
  set(run_ENV ${common_env})
  foreach(program wrapped ${run_MORE})
    orvpatch_add(${name}.${program} ${run_TREE}/tests/${program}_tests --gtest_brief=1
      --gtest_output=xml:${results}/${name}.${program}.xml)
  endforeach()
endfunction()

# --- the programs of this tree ---

set(label_unit unit)
set(label_wrapped unit)
set(label_ctl_unit ctl)
foreach(program unit wrapped ctl_unit)
  if(TARGET ${program}_tests)
    gtest_discover_tests(${program}_tests TEST_PREFIX ${program}. NO_PRETTY_VALUES NO_PRETTY_TYPES
      DISCOVERY_TIMEOUT 60 PROPERTIES LABELS ${label_${program}} TIMEOUT 300)
  endif()
endforeach()

# A file is a test; several where it takes long, by the words given here.
set(more_faults.system_calls PARTS 4 COST 100)
set(more_faults.kills PARTS 4 COST 100)
set(more_faults.combinations PARTS 4 COST 60)
set(more_faults.conditions COST 50)
set(more_ctl.power_loss COST 40)
set(more_ctl.reading_faults COST 60)
set(more_ctl.transaction_faults COST 60)
set(more_memory.memory_units PARTS 3 COST 100)
set(more_memory.memory_commands PARTS 4 COST 60)
set(more_fuzz.replay PARTS 3 COST 20)
set(more_fleet.engine PARTS 2 COST 50)
set(more_fleet.modules PARTS 2 COST 60)
set(more_fleet.network COST 60 PROCESSORS 2)
set(more_fleet.report COST 40)
set(more_fleet.role COST 40)
set(label_fuzz hostile)
file(GLOB_RECURSE files CONFIGURE_DEPENDS RELATIVE ${CMAKE_CURRENT_SOURCE_DIR} test_*.py)
foreach(file ${files})
  string(REGEX REPLACE "/.*" "" folder ${file})
  get_filename_component(name ${file} NAME_WE)
  string(REPLACE "test_" "" name ${name})
  if(folder MATCHES "^(cases|ctl|faults|fleet|fuzz|hostile|memory)$")
    set(label ${folder})
    if(DEFINED label_${folder})
      set(label ${label_${folder}})
    endif()
    orvpatch_pytest(${folder}.${name} PATHS ${file} LABELS ${label} ${more_${folder}.${name}})
  elseif(NOT folder MATCHES "^(bench|completions|house|man|packaging|support|target)$")
    message(FATAL_ERROR "no test runs tests/${file}: name its folder in tests/runs.cmake")
  endif()
endforeach()

foreach(folder completions house man support)
  orvpatch_pytest(house.${folder} PATHS ${folder} LABELS house COST 15)
endforeach()
foreach(language cpp python shell)
  orvpatch_test(house.lint.${language} LABELS house COMMAND scripts/lint ${language})
endforeach()
file(GLOB_RECURSE sources CONFIGURE_DEPENDS RELATIVE ${PROJECT_SOURCE_DIR} ${PROJECT_SOURCE_DIR}/src/*.cpp)
foreach(source ${sources})
  string(REGEX REPLACE "^src/(.*)\\.cpp$" "\\1" name ${source})
  orvpatch_test(house.tidy.${name} LABELS house COST 15 COMMAND tests/house/tidy ${CMAKE_BINARY_DIR} ${source})
endforeach()

# --- from here on: in the tree of the preset dev alone ---

if(NOT ORVPATCH_ALL_TESTS)
  return()
endif()
set(builds ${PROJECT_SOURCE_DIR}/build)
set(whole_program cases hostile fuzz)

# Permissions do not bind root: the units once more as an ordinary user, and with every directory listed in
# another order; the cases as well.
orvpatch_units(nobody LABELS unit MORE ctl_unit COST 20 UNDER tests/support/as-nobody)
orvpatch_units(listing LABELS listing COST 20 UNDER tests/support/relisted $<TARGET_FILE:listing>)
orvpatch_pytest(listing.cases PATHS cases hostile LABELS listing PARTS 4 COST 50
  UNDER tests/support/relisted $<TARGET_FILE:listing>)

# The sanitized build is clang's, too: the plain one is for runs without it.
orvpatch_build(clang LABELS clang)
orvpatch_build(sanitize LABELS sanitize)
set(sanitized LABELS sanitize NEEDS sanitize TREE ${builds}/sanitize
  ENV ASAN_OPTIONS=abort_on_error=1 UBSAN_OPTIONS=print_stacktrace=1:abort_on_error=1)
orvpatch_units(sanitize ${sanitized} MORE ctl_unit PARTS 2 COST 60)
orvpatch_pytest(sanitize.cases ${sanitized} PATHS ${whole_program} PARTS 6 COST 60)

orvpatch_build(fuzz LABELS fuzz)
file(GLOB corpora RELATIVE ${CMAKE_CURRENT_SOURCE_DIR}/fuzz/corpus ${CMAKE_CURRENT_SOURCE_DIR}/fuzz/corpus/*)
foreach(name ${corpora})
  orvpatch_test(fuzz.${name} LABELS fuzz NEEDS fuzz COST 10 COMMAND tests/fuzz/run ${name})
endforeach()

orvpatch_build(release LABELS release)
orvpatch_test(cases.demo LABELS cases NEEDS release COMMAND scripts/demo)

# The target's programs run with the C library that they are built with; for the comparison with the native program
# they run with the newest one.
orvpatch_build(ppc64le LABELS target)
set(old_libraries ${builds}/sysroot/ppc64le/usr/powerpc64le-linux-gnu)
set(target LABELS target NEEDS ppc64le release TREE ${builds}/ppc64le)
orvpatch_units(target ${target} UNDER qemu-ppc64le -L ${old_libraries} PARTS 2 COST 70)
orvpatch_pytest(target.cases ${target} ENV "ORVPATCH_RUNNER=/usr/bin/qemu-ppc64le -L '${old_libraries}'"
  PATHS cases PARTS 4 COST 100)
orvpatch_pytest(target.same ${target} ENV "ORVPATCH_RUNNER=/usr/bin/qemu-ppc64le -L /usr/powerpc64le-linux-gnu"
  ORVPATCH_NATIVE=${builds}/release/orvpatch ORVPATCH_TARGET=${builds}/ppc64le/orvpatch PATHS target PARTS 3 COST 60)
# libarchive asks for a newer C library: orvpatchctl runs with one of its own folder, and so does the installer
# beside it. apply and undo run the installer by themselves, which takes a packaged program (label packages).
orvpatch_test(build.ppc64le-run LABELS target COMMAND packaging/sysroot ppc64le-run)
set_tests_properties(build.ppc64le-run PROPERTIES FIXTURES_SETUP ppc64le-run)
set(run_libraries ${builds}/sysroot/ppc64le-run)
set(target_ctl LABELS target NEEDS ppc64le ppc64le-run TREE ${builds}/ppc64le)
orvpatch_test(target.ctl_unit ${target_ctl} COST 60 UNDER qemu-ppc64le -L ${run_libraries}
  COMMAND ${builds}/ppc64le/tests/ctl_unit_tests --gtest_brief=1 --gtest_output=xml:${results}/target.ctl_unit.xml)
orvpatch_pytest(target.ctl ${target_ctl} ENV "ORVPATCH_RUNNER=/usr/bin/qemu-ppc64le -L '${run_libraries}'"
  PARTS 2 COST 80 PATHS ctl/test_build.py ctl/test_history.py ctl/test_lint.py ctl/test_log.py ctl/test_show.py
  ctl/test_status.py ctl/test_verify.py)
orvpatch_build(ppc64 LABELS bigendian)
orvpatch_units(bigendian LABELS bigendian NEEDS ppc64 TREE ${builds}/ppc64 PARTS 2
  UNDER qemu-ppc64 -L /usr/powerpc64-linux-gnu)

# Each program twice for each processor, which the tests then find.
orvpatch_test(build.shipped LABELS packages PROCESSORS 2 COST 1000 COMMAND ${python} tests/packaging/shipped.py)
set_tests_properties(build.shipped PROPERTIES FIXTURES_SETUP shipped TIMEOUT 7200)
foreach(file ${files})
  if(file MATCHES "^(bench|packaging)/test_(.*)\\.py$")
    orvpatch_pytest(packages.${CMAKE_MATCH_2} PATHS ${file} LABELS packages NEEDS release shipped TREE ${builds}/release
      LOCK shipped COST 90)
  endif()
endforeach()
