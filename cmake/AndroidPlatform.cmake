# Android's own liblog and libutils, as Debian packages them (android-liblog-dev, android-libutils-dev).
find_path(ANDROID_INCLUDE_DIR utils/RefBase.h PATH_SUFFIXES android)

foreach(part IN ITEMS log utils)
    find_library(ANDROID_${part}_LIBRARY ${part}
        PATHS /usr/lib/${CMAKE_LIBRARY_ARCHITECTURE}/android
        NO_DEFAULT_PATH)
    if(NOT ANDROID_${part}_LIBRARY OR NOT ANDROID_INCLUDE_DIR)
        message(FATAL_ERROR "Android's lib${part} was not found: install android-liblog-dev and android-libutils-dev")
    endif()
    add_library(Android::${part} SHARED IMPORTED)
    set_target_properties(Android::${part} PROPERTIES
        IMPORTED_LOCATION "${ANDROID_${part}_LIBRARY}"
        # Imported targets' includes are SYSTEM ones: the platform's headers are not ours to warn about.
        INTERFACE_INCLUDE_DIRECTORIES "${ANDROID_INCLUDE_DIR}")
endforeach()
set_property(TARGET Android::utils APPEND PROPERTY INTERFACE_LINK_LIBRARIES Android::log)
