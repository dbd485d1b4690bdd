# The snapshot tests mount the simulated kernel target built in sim/.
if(TARGET orlo-configfs-sim)
  add_dependencies(test_snapshot_kernel orlo-configfs-sim orlo-sim-insmod)
endif()
