# The end-to-end tests drive the command line against the simulated kernel target.
add_dependencies(test_tools orloiscsi)
if(TARGET orlo-configfs-sim)
  add_dependencies(test_tools orlo-configfs-sim orlo-sim-insmod)
endif()
