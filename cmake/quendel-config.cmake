# find_package(quendel) gives the targets quendel::quendel, the shared library, and
# quendel::quendel_static, the static one.
include(CMakeFindDependencyMacro)
find_dependency(PkgConfig)

# The headers of libquendel include those of JsonCpp.
pkg_check_modules(JSONCPP QUIET IMPORTED_TARGET jsoncpp)
if(NOT JSONCPP_FOUND)
  set(quendel_NOT_FOUND_MESSAGE "libquendel needs JsonCpp, and pkg-config does not find jsoncpp")
  set(quendel_FOUND FALSE)
  return()
endif()

# Only a program that links the static library has to have these.
pkg_check_modules(CURL QUIET IMPORTED_TARGET libcurl)
pkg_check_modules(CRYPTO QUIET IMPORTED_TARGET libcrypto)

include(${CMAKE_CURRENT_LIST_DIR}/quendel-targets.cmake)
