# The end-to-end tests drive the command line against the simulated kernel target.
add_dependencies(test_tools orloiscsi)
if(TARGET orlo-configfs-sim)
  add_dependencies(test_tools orlo-configfs-sim orlo-sim-insmod)
endif()
# The version orloiscsi --version must print.
target_compile_definitions(test_tools PRIVATE ORLO_PROJECT_VERSION="${PROJECT_VERSION}")
