# ABI numbers of the three shared libraries. Bump the SOVERSION only when an
# exported record or function changes incompatibly; new functions go last.
set(KX_CU_VERSION 1.0.0)
set(KX_CU_SOVERSION 1)
set(KX_TR_VERSION 1.0.0)
set(KX_TR_SOVERSION 1)
set(KX_ACL_VERSION 1.0.0)
set(KX_ACL_SOVERSION 1)

# Gives a shared library its version, SONAME and linker version script.
function(kx_shared_library target version soversion script)
  set_target_properties(${target} PROPERTIES VERSION ${version} SOVERSION ${soversion})
  target_link_options(${target} PRIVATE "-Wl,--version-script=${script}")
  # clang leaves the sanitizer runtimes out of shared libraries: the fuzz
  # targets that load them provide those symbols.
  if(NOT KX_FUZZ)
    target_link_options(${target} PRIVATE "-Wl,--no-undefined")
  endif()
  set_property(TARGET ${target} APPEND PROPERTY LINK_DEPENDS ${script})
endfunction()
