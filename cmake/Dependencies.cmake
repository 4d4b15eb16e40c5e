# Every dependency comes from a Debian package (see scripts/install-deps.sh).
find_package(Protobuf REQUIRED)
find_package(glog REQUIRED)
find_package(OpenCV REQUIRED COMPONENTS core imgproc)
find_package(Boost REQUIRED COMPONENTS thread)
find_package(OpenBLAS REQUIRED)
find_package(leveldb REQUIRED)

add_library(tavi_openblas INTERFACE)
target_include_directories(tavi_openblas INTERFACE ${OpenBLAS_INCLUDE_DIRS})
target_link_libraries(tavi_openblas INTERFACE ${OpenBLAS_LIBRARIES})
