# Debian's host builds of Android's platform libraries sit in `android`
# subfolders of the system include and multiarch library folders.
set(ANDROID_HOST_INCLUDE_DIR /usr/include/android)
set(ANDROID_HOST_LIB_DIR /usr/lib/${CMAKE_LIBRARY_ARCHITECTURE}/android)

function(android_host_library name)
  find_library(_path ${name} PATHS ${ANDROID_HOST_LIB_DIR} NO_DEFAULT_PATH REQUIRED)
  add_library(android::${name} SHARED IMPORTED GLOBAL)
  set_target_properties(android::${name} PROPERTIES
    IMPORTED_LOCATION ${_path}
    INTERFACE_INCLUDE_DIRECTORIES ${ANDROID_HOST_INCLUDE_DIR}
    # Found at run time without LD_LIBRARY_PATH, as on a device.
    INTERFACE_LINK_OPTIONS "LINKER:-rpath,${ANDROID_HOST_LIB_DIR}")
  unset(_path CACHE)
endfunction()

android_host_library(log)

# libbase's header-only parts (unique_fd, thread annotations): the include
# folder alone, so nothing of libbase is linked.
add_library(android::base_headers INTERFACE IMPORTED GLOBAL)
set_target_properties(android::base_headers PROPERTIES
  INTERFACE_INCLUDE_DIRECTORIES ${ANDROID_HOST_INCLUDE_DIR})
