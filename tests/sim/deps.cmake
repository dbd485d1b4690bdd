# The simulator tests run the programs built in sim/, and test its request loop directly.
if(TARGET orlo-configfs-sim)
  add_dependencies(test_sim orlo-configfs-sim orlo-sim-insmod)
  target_link_libraries(test_sim PRIVATE orlo_configfs_loop)
  target_compile_definitions(test_sim PRIVATE ORLO_HAVE_SIM_LOOP=1)
endif()
