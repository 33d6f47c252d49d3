# SPDX-License-Identifier: Apache-2.0
# The CMake package of libkesto: target kesto::kesto, the shared library, and kesto::kesto-static.
include(CMakeFindDependencyMacro)
find_dependency(Threads)
include("${CMAKE_CURRENT_LIST_DIR}/kestoTargets.cmake")
