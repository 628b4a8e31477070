include("${CMAKE_CURRENT_LIST_DIR}/liborvantaTargets.cmake")
