# The end-to-end tests drive the whole service against the simulated kernel target built
# in sim/.
if(TARGET orlo-configfs-sim)
  add_dependencies(test_e2e orlo-configfs-sim orlo-sim-insmod)
endif()
