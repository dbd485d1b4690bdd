# The engine tests run the daemon and the client built in tools/, and a test peer that
# streams checked messages from inside a network namespace.
add_executable(orlocomm-test-peer ${CMAKE_CURRENT_SOURCE_DIR}/comm/peer/orlocomm_test_peer.cpp)
target_link_libraries(orlocomm-test-peer PRIVATE orloiscsiep_static)
target_compile_definitions(orlocomm-test-peer PRIVATE _GNU_SOURCE)
add_dependencies(test_comm orlocommd orlocomm-cat orlocomm-test-peer)
