# SPDX-License-Identifier: MIT
# The path at which a test starts one of the project's programs.
#
#   kolvrand_test_program(VAR TARGET)
#
# Natively that is the program itself. Under an emulator
# (CMAKE_CROSSCOMPILING_EMULATOR, a cross build) the kernel cannot start a
# foreign program, so the path is a script that starts it in the emulator. The
# script sits at the program's own path relative to the build tree, but under
# KOLVRAND_TEST_PROGRAM_DIR instead: a test that looks for a program from that
# directory finds the script.
set(KOLVRAND_TEST_PROGRAM_DIR ${PROJECT_BINARY_DIR})
if(CMAKE_CROSSCOMPILING_EMULATOR)
  set(KOLVRAND_TEST_PROGRAM_DIR ${PROJECT_BINARY_DIR}/emulated)
endif()

function(kolvrand_test_program var target)
  if(NOT CMAKE_CROSSCOMPILING_EMULATOR)
    set(${var} $<TARGET_FILE:${target}> PARENT_SCOPE)
    return()
  endif()
  get_target_property(dir ${target} BINARY_DIR)
  file(RELATIVE_PATH dir ${PROJECT_BINARY_DIR} ${dir})
  get_target_property(name ${target} OUTPUT_NAME)
  if(NOT name)
    set(name ${target})
  endif()
  set(script ${KOLVRAND_TEST_PROGRAM_DIR}/${dir}/${name})
  list(JOIN CMAKE_CROSSCOMPILING_EMULATOR " " emulator)
  file(GENERATE OUTPUT ${script}
       CONTENT "#!/bin/sh\nexec ${emulator} $<TARGET_FILE:${target}> \"$@\"\n"
       FILE_PERMISSIONS OWNER_READ OWNER_WRITE OWNER_EXECUTE GROUP_READ GROUP_EXECUTE
                        WORLD_READ WORLD_EXECUTE)
  set(${var} ${script} PARENT_SCOPE)
endfunction()
