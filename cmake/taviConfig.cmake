# find_package(tavi) gives the imported target tavi::tavi.
include("${CMAKE_CURRENT_LIST_DIR}/taviTargets.cmake")
