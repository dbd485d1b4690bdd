# The iSNS tests mount the simulated kernel target built in sim/, start the service
# through its insmod stand-in, and drive the command line.
add_dependencies(test_isns orloiscsi)
if(TARGET orlo-configfs-sim)
  add_dependencies(test_isns orlo-configfs-sim orlo-sim-insmod)
endif()
