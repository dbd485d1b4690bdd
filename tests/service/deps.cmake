# The service tests mount the simulated kernel target built in sim/ and load modules
# through its insmod stand-in.
if(TARGET orlo-configfs-sim)
  add_dependencies(test_service orlo-configfs-sim orlo-sim-insmod)
endif()
