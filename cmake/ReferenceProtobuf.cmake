# SPDX-License-Identifier: MIT
# libprotobuf's classes for the shipped schema, the reference our messages are
# checked and measured against (tests, fuzzing, benchmarks; never the daemon or
# rcmodel). Two copies of the schema are generated: STEM_plain under PACKAGE,
# and STEM_packed under PACKAGE_packed with every list [packed = true]. The
# packages keep them from ever meeting our classes by name.
#
#   kolvrand_reference_protobuf(TARGET STEM PACKAGE)
#
# adds the generated sources to TARGET, their directory to its include path,
# and links libprotobuf. Returns without doing anything (and sets
# KOLVRAND_REFERENCE_PROTOBUF_FOUND to FALSE) when protoc or libprotobuf is
# missing.
function(kolvrand_reference_protobuf target stem package)
  find_package(Protobuf QUIET)
  if(NOT Protobuf_FOUND OR NOT Protobuf_PROTOC_EXECUTABLE)
    set(KOLVRAND_REFERENCE_PROTOBUF_FOUND FALSE PARENT_SCOPE)
    return()
  endif()
  set(KOLVRAND_REFERENCE_PROTOBUF_FOUND TRUE PARENT_SCOPE)

  set(schema ${PROJECT_SOURCE_DIR}/model/battery_model.proto)
  set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${schema})
  file(READ ${schema} text)
  set(dir ${CMAKE_CURRENT_BINARY_DIR}/${stem}_reference)
  string(REPLACE "package kolvrand;" "package ${package};" plain "${text}")
  string(REGEX REPLACE "(repeated float [A-Za-z0-9_]+ = [0-9]+)" "\\1 [packed = true]" packed
                       "${text}")
  string(REPLACE "package kolvrand;" "package ${package}_packed;" packed "${packed}")
  file(CONFIGURE OUTPUT ${dir}/${stem}_plain.proto CONTENT "${plain}" @ONLY)
  file(CONFIGURE OUTPUT ${dir}/${stem}_packed.proto CONTENT "${packed}" @ONLY)

  set(sources)
  foreach(name ${stem}_plain ${stem}_packed)
    add_custom_command(
      OUTPUT ${dir}/${name}.pb.cc ${dir}/${name}.pb.h
      COMMAND ${Protobuf_PROTOC_EXECUTABLE} --cpp_out=${dir} -I ${dir} ${dir}/${name}.proto
      DEPENDS ${dir}/${name}.proto
      COMMENT "Generating the ${name} reference classes")
    list(APPEND sources ${dir}/${name}.pb.cc)
  endforeach()
  # Generated code: not ours to keep warning-free.
  set_source_files_properties(${sources} PROPERTIES COMPILE_OPTIONS -w)
  target_sources(${target} PRIVATE ${sources})
  target_include_directories(${target} SYSTEM PRIVATE ${dir})
  target_link_libraries(${target} PRIVATE protobuf::libprotobuf)
endfunction()
