# The first step of "cmake --install": after a failed or partial build it
# would otherwise copy whatever exists and stop at the first file missing,
# leaving half a tree behind. This step checks that every file the build
# makes for installation is there, and fails before anything is written.
# The list names each built file that an install() rule copies.
install(CODE [[
  set(kx_missing "")
  foreach(file "$<TARGET_FILE:kx_cu>" "$<TARGET_FILE:kx_tr>" "$<TARGET_FILE:kx_acl>"
               "$<TARGET_FILE:kxacl>" "$<TARGET_PROPERTY:kx_catalogue,KX_CATALOGUE_FILE>")
    if(NOT EXISTS "${file}")
      list(APPEND kx_missing "${file}")
    endif()
  endforeach()
  if(kx_missing)
    list(JOIN kx_missing "\n  " kx_missing)
    message(FATAL_ERROR "Nothing installed: the build is incomplete. Missing:\n  ${kx_missing}\n"
                        "Build first (cmake --build <build directory>).")
  endif()
]])
