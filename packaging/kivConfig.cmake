# kiv::kiv is the shared library, kiv::kiv_static the static one.
include("${CMAKE_CURRENT_LIST_DIR}/kivTargets.cmake")
