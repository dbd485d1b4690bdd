# The iSNS tests mount the simulated kernel target built in sim/ and start the service
# through its insmod stand-in.
if(TARGET orlo-configfs-sim)
  add_dependencies(test_isns orlo-configfs-sim orlo-sim-insmod)
endif()
