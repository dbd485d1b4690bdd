# The simulator tests run the programs built in sim/.
if(TARGET orlo-configfs-sim)
  add_dependencies(test_sim orlo-configfs-sim orlo-sim-insmod)
endif()
