# The example files under examples/ are what generate_appliance writes now.
# -DGENERATOR=program -DOUT=scratch directory -DEXPECTED=examples directory
file(REMOVE_RECURSE ${OUT})
file(MAKE_DIRECTORY ${OUT})
execute_process(COMMAND ${GENERATOR} ${OUT} RESULT_VARIABLE status)
if(NOT status EQUAL 0)
  message(FATAL_ERROR "generate_appliance failed: ${status}")
endif()
foreach(name large-appliance.host.json large-appliance.reply.json large-appliance.devices)
  execute_process(COMMAND ${CMAKE_COMMAND} -E compare_files ${OUT}/${name} ${EXPECTED}/${name}
                  RESULT_VARIABLE differ)
  if(NOT differ EQUAL 0)
    message(FATAL_ERROR "examples/${name} differs from what generate_appliance writes; "
                        "run generate_appliance examples and commit the result")
  endif()
endforeach()
