# Debian splits OpenCV into per-module -dev packages, and only the meta package
# (which drags in every module) ships OpenCVConfig.cmake. We need four modules,
# so we locate them directly and wrap each in an imported target.
find_path(VORA_OPENCV_INCLUDE_DIR opencv2/core.hpp PATH_SUFFIXES opencv4 REQUIRED)

function(vora_find_opencv_module module)
    if(TARGET opencv::${module})
        return()
    endif()
    find_library(VORA_OPENCV_${module}_LIBRARY NAMES opencv_${module} REQUIRED)
    add_library(opencv::${module} SHARED IMPORTED GLOBAL)
    set_target_properties(opencv::${module} PROPERTIES
        IMPORTED_LOCATION "${VORA_OPENCV_${module}_LIBRARY}"
        INTERFACE_INCLUDE_DIRECTORIES "${VORA_OPENCV_INCLUDE_DIR}")
endfunction()

foreach(module core imgproc dnn imgcodecs)
    vora_find_opencv_module(${module})
endforeach()
