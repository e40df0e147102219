# qv_dtrace_provider(TARGET PROVIDER_FILE)
#
# Turns a DTrace provider description (.d) into a static library TARGET that
# carries the probes' is-enabled semaphores (dtrace -G) and exports the
# generated probe header (dtrace -h) as "<provider-file-stem>_provider.h".
find_program(QV_DTRACE dtrace REQUIRED)

function(qv_dtrace_provider target d_file)
  get_filename_component(stem ${d_file} NAME_WE)
  get_filename_component(d_abs ${d_file} ABSOLUTE)
  set(gen_dir ${CMAKE_CURRENT_BINARY_DIR}/${target}_gen)
  set(header ${gen_dir}/${stem}_provider.h)
  set(object ${gen_dir}/${stem}_semaphores.o)
  file(MAKE_DIRECTORY ${gen_dir})
  add_custom_command(
    OUTPUT ${header}
    COMMAND ${QV_DTRACE} -h -s ${d_abs} -o ${header}
    DEPENDS ${d_abs}
    COMMENT "dtrace -h ${stem}.d"
    VERBATIM)
  add_custom_command(
    OUTPUT ${object}
    COMMAND ${CMAKE_COMMAND} -E env CC=${CMAKE_C_COMPILER} ${QV_DTRACE} -G -s ${d_abs} -o ${object}
    DEPENDS ${d_abs}
    COMMENT "dtrace -G ${stem}.d"
    VERBATIM)
  add_custom_target(${target}_generate DEPENDS ${header} ${object})
  add_library(${target} STATIC ${object})
  set_target_properties(${target} PROPERTIES LINKER_LANGUAGE C)
  add_dependencies(${target} ${target}_generate)
  target_include_directories(${target} PUBLIC ${gen_dir})
endfunction()
