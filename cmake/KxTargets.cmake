# Most of compiling is reading headers, so files of a target are compiled several as one: which, says
# tools/unity_groups.py, afresh at each configuration. That saves two thirds of a whole build and
# costs time in daily work, where one changed file has its neighbours compiled again: see KX_UNITY.
function(_kx_unity target)
  get_target_property(sources ${target} SOURCES)
  list(FILTER sources INCLUDE REGEX "\\.cpp$")
  list(LENGTH sources count)
  if(NOT KX_UNITY OR count LESS 2)
    return()
  endif()
  find_package(Python3 REQUIRED COMPONENTS Interpreter)
  execute_process(
    COMMAND ${Python3_EXECUTABLE} -B ${PROJECT_SOURCE_DIR}/tools/unity_groups.py ${sources}
    WORKING_DIRECTORY ${CMAKE_CURRENT_SOURCE_DIR}
    OUTPUT_VARIABLE lines OUTPUT_STRIP_TRAILING_WHITESPACE COMMAND_ERROR_IS_FATAL ANY)
  string(REGEX REPLACE ";" "|" lines "${lines}")
  string(REGEX REPLACE "\n" ";" lines "${lines}")
  foreach(line IN LISTS lines)
    string(REGEX MATCH "^(.*)[|](.*)$" matched "${line}")
    set_source_files_properties(${CMAKE_MATCH_1} PROPERTIES UNITY_GROUP ${CMAKE_MATCH_2})
  endforeach()
  set_target_properties(${target} PROPERTIES UNITY_BUILD ON UNITY_BUILD_MODE GROUP)
endfunction()

# What is compiled for longer than the tests run in it is not worth optimising for them.
function(_kx_not_optimised_for_tests target)
  target_compile_options(${target} PRIVATE $<$<CONFIG:Debug>:-O0>)
endfunction()

# kx_library(NAME [COLD] [GLOBS pattern...] [EXCLUDE regex] [DEPS target...])
# A static library of all *.cpp below the calling folder (or of GLOBS), less the paths that match
# EXCLUDE (relative to the folder). A folder without sources becomes an INTERFACE library. COLD: the
# tests spend little time in it.
function(kx_library name)
  cmake_parse_arguments(arg "COLD" "EXCLUDE" "GLOBS;DEPS" ${ARGN})
  if(NOT arg_GLOBS)
    set(arg_GLOBS *.cpp)
  endif()
  file(GLOB_RECURSE sources RELATIVE ${CMAKE_CURRENT_SOURCE_DIR} CONFIGURE_DEPENDS ${arg_GLOBS})
  if(arg_EXCLUDE)
    list(FILTER sources EXCLUDE REGEX "${arg_EXCLUDE}")
  endif()
  if(sources)
    add_library(${name} STATIC ${sources})
    _kx_unity(${name})
    target_link_libraries(${name} PUBLIC kx_options ${arg_DEPS})
    if(arg_COLD)
      _kx_not_optimised_for_tests(${name})
    endif()
  else()
    add_library(${name} INTERFACE)
    target_link_libraries(${name} INTERFACE kx_options ${arg_DEPS})
  endif()
endfunction()

# kx_program(NAME MAIN candidate... DEPS target...)
# A program whose main file is the first candidate that exists; none exists: no program.
function(kx_program name)
  cmake_parse_arguments(arg "" "" "MAIN;DEPS" ${ARGN})
  foreach(candidate IN LISTS arg_MAIN)
    file(GLOB found CONFIGURE_DEPENDS ${candidate})
    if(found)
      add_executable(${name} ${candidate})
      target_link_libraries(${name} PRIVATE kx_options ${arg_DEPS})
      install(TARGETS ${name} RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
      return()
    endif()
  endforeach()
endfunction()

# Gives in OUT the googletest filter patterns of the concurrency tests among FILES: every suite or
# test with "Concurrency" in its name, and every suite of a file with it in the file's name.
function(_kx_concurrency_patterns out files)
  set(patterns "*Concurrency*")
  foreach(file IN LISTS files)
    if(file MATCHES "Concurrency[^/]*$")
      set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${file})
      file(STRINGS ${file} lines REGEX "^ *(TEST|TEST_F|TEST_P|RC_GTEST_PROP)\\(")
      foreach(line IN LISTS lines)
        string(REGEX REPLACE "^[^(]*\\( *([A-Za-z0-9_]+).*" "\\1" suite "${line}")
        list(APPEND patterns "*${suite}.*")
      endforeach()
    endif()
  endforeach()
  list(REMOVE_DUPLICATES patterns)
  list(JOIN patterns ":" patterns)
  set(${out} "${patterns}" PARENT_SCOPE)
endfunction()

# Sets OUT when a concurrency test is among FILES.
function(_kx_has_concurrency out files)
  set(${out} FALSE PARENT_SCOPE)
  foreach(file IN LISTS files)
    file(STRINGS ${file} lines REGEX "^ *(TEST|TEST_F|TEST_P|RC_GTEST_PROP)\\(.*Concurrency")
    if(lines OR file MATCHES "Concurrency[^/]*$")
      set(${out} TRUE PARENT_SCOPE)
    endif()
  endforeach()
endfunction()

# Starting a sanitized program is slow: one entry of ctest for all tests of a folder, and one for its
# concurrency tests.
function(_kx_sanitized_test folder tests all_concurrent concurrent)
  _kx_concurrency_patterns(patterns "${tests}")
  if(all_concurrent)
    set(patterns "*")
    set(concurrent TRUE)
  else()
    add_test(NAME ${folder} COMMAND test_${folder} --gtest_brief=1 "--gtest_filter=-${patterns}")
    set_tests_properties(${folder} PROPERTIES TIMEOUT 1500 LABELS ${folder} COST 2)
  endif()
  if(concurrent)
    add_test(NAME ${folder}.concurrency
             COMMAND test_${folder} --gtest_brief=1 "--gtest_filter=${patterns}")
    set_tests_properties(${folder}.concurrency PROPERTIES TIMEOUT 900
                         LABELS "${folder};concurrency")
  endif()
endfunction()

# kx_test(FOLDER [CONCURRENCY] [PROGRAMS] [LIBRARIES target...])
# tests/FOLDER/*.cpp -> executable test_FOLDER, each of its tests an entry of ctest with the label
# FOLDER, and "concurrency" where _kx_concurrency_patterns says so or, with CONCURRENCY, on all.
# PROGRAMS: the tests run our programs or load the module, so these are built before.
function(kx_test folder)
  cmake_parse_arguments(arg "CONCURRENCY;PROGRAMS" "" "LIBRARIES" ${ARGN})
  set(here ${PROJECT_SOURCE_DIR}/tests/${folder})
  file(GLOB_RECURSE sources CONFIGURE_DEPENDS ${here}/*.cpp)
  set(tests ${sources})
  list(FILTER tests INCLUDE REGEX "Test\\.cpp$")
  if(NOT tests)
    return()
  endif()
  set(target test_${folder})
  add_executable(${target} ${sources})
  _kx_unity(${target})
  target_link_libraries(${target} PRIVATE kx_options kx_test_support ${arg_LIBRARIES} kx_testing
                        rapidcheck
                        GTest::gmock_main GTest::gmock GTest::gtest)
  _kx_not_optimised_for_tests(${target})
  target_compile_definitions(${target} PRIVATE
    KX_TEST_SOURCE_DIR="${PROJECT_SOURCE_DIR}"
    KX_TEST_BIN_DIR="${CMAKE_RUNTIME_OUTPUT_DIRECTORY}"
    KX_TEST_PLUGIN_PATH="${CMAKE_LIBRARY_OUTPUT_DIRECTORY}/kxsyncbundle.so")
  if(arg_PROGRAMS)
    foreach(program IN ITEMS kxsyncbundle kxsync ferrule)
      if(TARGET ${program})
        add_dependencies(${target} ${program})
      endif()
    endforeach()
  endif()
  set(common DISCOVERY_MODE PRE_TEST DISCOVERY_TIMEOUT 60)
  _kx_has_concurrency(concurrent "${tests}")
  if(arg_CONCURRENCY OR concurrent)
    set_property(GLOBAL APPEND PROPERTY KX_CONCURRENCY_TARGETS ${target})
  endif()
  if(KX_SANITIZE)
    _kx_sanitized_test(${folder} "${tests}" "${arg_CONCURRENCY}" "${concurrent}")
    return()
  endif()
  if(arg_CONCURRENCY)
    gtest_discover_tests(${target} ${common} TEST_LIST ${target}_CONCURRENCY
                         PROPERTIES TIMEOUT 300)
  else()
    _kx_concurrency_patterns(patterns "${tests}")
    gtest_discover_tests(${target} ${common} TEST_FILTER "-${patterns}"
                         PROPERTIES TIMEOUT 300 LABELS ${folder})
    gtest_discover_tests(${target} ${common} TEST_FILTER "${patterns}"
                         TEST_LIST ${target}_CONCURRENCY PROPERTIES TIMEOUT 300)
  endif()
  # Two labels cannot be given above (a list does not survive there), so ctest sets them itself.
  set(labels ${CMAKE_CURRENT_BINARY_DIR}/${target}_labels.cmake)
  file(WRITE ${labels} "if(${target}_CONCURRENCY)\n  set_tests_properties(\${${target}_CONCURRENCY}"
                       " PROPERTIES LABELS \"${folder};concurrency\")\nendif()\n")
  set_property(DIRECTORY APPEND PROPERTY TEST_INCLUDE_FILES ${labels})
endfunction()

# kx_python_test(FOLDER): each tests/FOLDER/*_test.py, test_*.py or *Test.py is an entry of ctest,
# "FOLDER.<name>". KX_BIN names the directory of the programs, KX_MAKE_SAMPLE the sample's maker.
# ctest starts what costs most first, so that the longest do not run alone at the end.
function(kx_python_test folder)
  set(here ${PROJECT_SOURCE_DIR}/tests/${folder})
  file(GLOB scripts CONFIGURE_DEPENDS ${here}/*_test.py ${here}/test_*.py ${here}/*Test.py)
  foreach(script IN LISTS scripts)
    get_filename_component(name ${script} NAME_WE)
    add_test(NAME ${folder}.${name} COMMAND ${Python3_EXECUTABLE} -B ${script})
    set_tests_properties(${folder}.${name} PROPERTIES LABELS ${folder} TIMEOUT 900
      WORKING_DIRECTORY ${here}
      ENVIRONMENT "KX_BIN=${CMAKE_RUNTIME_OUTPUT_DIRECTORY};KX_MAKE_SAMPLE=$<TARGET_FILE:make-sample-library>")
    if(name MATCHES "^test_(restore|interruption|backup)$")
      set_tests_properties(${folder}.${name} PROPERTIES COST 3)
    endif()
  endforeach()
endfunction()
