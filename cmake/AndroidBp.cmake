# Android.bp builds the same modules from the same sources. Each module is
# recorded here with the CMake target whose own sources it must list, and
# build/android-bp-sources.txt (one module per line, its sources relative to
# the project root) lets tools/lint/check-android-bp.sh hold the two builds
# together.
set_property(GLOBAL PROPERTY HOSTCALL_BP_MODULES "")

function(hostcall_android_bp module target)
  get_target_property(dir ${target} SOURCE_DIR)
  get_target_property(sources ${target} SOURCES)
  set(files)
  foreach(source ${sources})
    if(NOT source MATCHES "^\\$<")  # objects of another target
      get_filename_component(path ${source} ABSOLUTE BASE_DIR ${dir})
      file(RELATIVE_PATH path ${PROJECT_SOURCE_DIR} ${path})
      list(APPEND files ${path})
    endif()
  endforeach()
  list(SORT files)
  list(JOIN files " " line)
  set_property(GLOBAL APPEND PROPERTY HOSTCALL_BP_MODULES "${module} ${line}")
endfunction()

function(hostcall_write_android_bp_sources)
  get_property(modules GLOBAL PROPERTY HOSTCALL_BP_MODULES)
  list(SORT modules)
  list(JOIN modules "\n" text)
  file(WRITE ${CMAKE_BINARY_DIR}/android-bp-sources.txt "${text}\n")
endfunction()
