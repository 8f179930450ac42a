# What an installed tree offers other builds: a CMake package with imported
# targets in the kxacl:: namespace and a pkg-config file.
include(CMakePackageConfigHelpers)

set_target_properties(kx_cu PROPERTIES EXPORT_NAME cu)
set_target_properties(kx_tr PROPERTIES EXPORT_NAME tr)
set_target_properties(kx_acl PROPERTIES EXPORT_NAME acl)
# libkx_acl finds libkx_cu and libkx_tr beside itself, so that a program whose
# run path leads to it works in any prefix without LD_LIBRARY_PATH.
set_target_properties(kx_acl PROPERTIES INSTALL_RPATH "\$ORIGIN")

set(KX_CMAKE_PACKAGE_DIR ${CMAKE_INSTALL_LIBDIR}/cmake/kxacl)
install(EXPORT kxaclTargets NAMESPACE kxacl:: DESTINATION ${KX_CMAKE_PACKAGE_DIR})
configure_package_config_file(cmake/kxaclConfig.cmake.in
  ${CMAKE_CURRENT_BINARY_DIR}/kxaclConfig.cmake
  INSTALL_DESTINATION ${KX_CMAKE_PACKAGE_DIR})
# Releases of one major version keep the ABI, and so the SONAMEs.
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/kxaclConfigVersion.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/kxaclConfig.cmake
              ${CMAKE_CURRENT_BINARY_DIR}/kxaclConfigVersion.cmake
        DESTINATION ${KX_CMAKE_PACKAGE_DIR})

# The pkg-config file names the prefix that the tree is installed to, which
# "cmake --install --prefix" may change: its last step runs at install time.
foreach(dir LIBDIR INCLUDEDIR)
  if(IS_ABSOLUTE "${CMAKE_INSTALL_${dir}}")
    set(KX_PC_${dir} "${CMAKE_INSTALL_${dir}}")
  else()
    set(KX_PC_${dir} "\${prefix}/${CMAKE_INSTALL_${dir}}")
  endif()
endforeach()
set(KX_PC_PREFIX "@CMAKE_INSTALL_PREFIX@")
configure_file(cmake/kxacl.pc.in ${CMAKE_CURRENT_BINARY_DIR}/kxacl.pc.in @ONLY)
install(CODE "configure_file(\"${CMAKE_CURRENT_BINARY_DIR}/kxacl.pc.in\"
                             \"${CMAKE_CURRENT_BINARY_DIR}/kxacl.pc\" @ONLY)")
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/kxacl.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
