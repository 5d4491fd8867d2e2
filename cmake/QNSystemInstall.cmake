# Install rules and Debian packages of the library.
#
# Two components:
#   runtime  lib/<multiarch>/libQNSystem.so.1 and .so.1.0.0                  (package libqnsystem1)
#   dev      the .so link, include/QNSystem/*.h, lib/<multiarch>/cmake/QNSystem/,
#            lib/<multiarch>/pkgconfig/qnsystem.pc, the guide                 (package libqnsystem-dev)
# Consumers: find_package(QNSystem 1.0 CONFIG REQUIRED) and QNSystem::QNSystem, or
# pkg-config --cflags --libs qnsystem. Either way headers are included by base name.

option(QN_INSTALL "Add the library's install rules" ON)
if(NOT QN_INSTALL)
  return()
endif()

include(CMakePackageConfigHelpers)

set(QN_CMAKE_DIR ${CMAKE_INSTALL_LIBDIR}/cmake/QNSystem)

install(TARGETS QNSystem EXPORT QNSystemTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT runtime NAMELINK_COMPONENT dev)
install(FILES ${QN_PUBLIC_HEADERS} DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/QNSystem COMPONENT dev)
install(EXPORT QNSystemTargets NAMESPACE QNSystem:: DESTINATION ${QN_CMAKE_DIR} COMPONENT dev)

configure_package_config_file(${CMAKE_CURRENT_LIST_DIR}/QNSystemConfig.cmake.in
  ${PROJECT_BINARY_DIR}/QNSystemConfig.cmake INSTALL_DESTINATION ${QN_CMAKE_DIR})
# A consumer asking for 1.x gets any 1.y: the major number is the SONAME's.
write_basic_package_version_file(${PROJECT_BINARY_DIR}/QNSystemConfigVersion.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES ${PROJECT_BINARY_DIR}/QNSystemConfig.cmake ${PROJECT_BINARY_DIR}/QNSystemConfigVersion.cmake
  DESTINATION ${QN_CMAKE_DIR} COMPONENT dev)

# The .pc file finds its prefix from its own place (${pcfiledir}), so a tree installed with
# "cmake --install --prefix P" or unpacked anywhere else works without editing it.
if(IS_ABSOLUTE "${CMAKE_INSTALL_LIBDIR}" OR IS_ABSOLUTE "${CMAKE_INSTALL_INCLUDEDIR}")
  set(QN_PC_PREFIX "${CMAKE_INSTALL_PREFIX}")
  set(QN_PC_LIBDIR "${CMAKE_INSTALL_FULL_LIBDIR}")
  set(QN_PC_INCLUDEDIR "${CMAKE_INSTALL_FULL_INCLUDEDIR}")
else()
  file(RELATIVE_PATH QN_PC_PREFIX "/root/${CMAKE_INSTALL_LIBDIR}/pkgconfig" "/root")
  string(REGEX REPLACE "/$" "" QN_PC_PREFIX "${QN_PC_PREFIX}")
  set(QN_PC_PREFIX "\${pcfiledir}/${QN_PC_PREFIX}")
  set(QN_PC_LIBDIR "\${prefix}/${CMAKE_INSTALL_LIBDIR}")
  set(QN_PC_INCLUDEDIR "\${prefix}/${CMAKE_INSTALL_INCLUDEDIR}")
endif()
configure_file(${CMAKE_CURRENT_LIST_DIR}/qnsystem.pc.in ${PROJECT_BINARY_DIR}/qnsystem.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/qnsystem.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT dev)
install(FILES ${PROJECT_SOURCE_DIR}/docs/GUIDE.md DESTINATION ${CMAKE_INSTALL_DOCDIR} COMPONENT dev)

# Packages only for our own build: an embedding project has its own CPack set-up.
if(NOT PROJECT_IS_TOP_LEVEL)
  return()
endif()

set(QN_PACKAGE_CONTACT "libQNSystem maintainers <root@localhost>" CACHE STRING "Maintainer of the Debian packages")
set(CPACK_PACKAGE_NAME qnsystem)
set(CPACK_PACKAGE_VENDOR "libQNSystem")
set(CPACK_PACKAGE_CONTACT "${QN_PACKAGE_CONTACT}")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "${PROJECT_DESCRIPTION}")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_COMPONENTS_ALL runtime dev)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_RELEASE 1)

set(CPACK_DEBIAN_RUNTIME_PACKAGE_NAME libqnsystem${PROJECT_VERSION_MAJOR})
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SECTION libs)
# dpkg-shlibdeps derives the libc6/libstdc++6/libgcc-s1 versions from the built library; the shlibs
# file and the ldconfig trigger make it a proper shared-library package.
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_GENERATE_SHLIBS_POLICY ">=")

set(CPACK_DEBIAN_DEV_PACKAGE_NAME libqnsystem-dev)
set(CPACK_DEBIAN_DEV_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEV_PACKAGE_DEPENDS
  "libqnsystem${PROJECT_VERSION_MAJOR} (= ${PROJECT_VERSION}-${CPACK_DEBIAN_PACKAGE_RELEASE})")
set(CPACK_DEBIAN_DEV_PACKAGE_SUGGESTS "cmake, pkgconf")

include(CPack)
