# What `cmake --install` puts where, in four components: runtime, development, testing and tools.
include(CMakePackageConfigHelpers)

# libbinder is this project's own and no other's, so it does not lie where the system looks for libraries.
set(TAVO_PRIVATE_LIBDIR "${CMAKE_INSTALL_LIBDIR}/tavoosal")
set(TAVO_BINDER_INCLUDEDIR "${CMAKE_INSTALL_INCLUDEDIR}/tavoosal-binder")

# tavo_install_rpath(TARGET DIRECTORY): how a target installed in DIRECTORY finds this project's libraries. Those
# of the platform are found where they were linked from.
function(tavo_install_rpath target directory)
    if(TAVO_RELOCATABLE)
        set(places "")
        foreach(libdir IN ITEMS "${CMAKE_INSTALL_FULL_LIBDIR}" "${CMAKE_INSTALL_PREFIX}/${TAVO_PRIVATE_LIBDIR}")
            file(RELATIVE_PATH relative "${CMAKE_INSTALL_PREFIX}/${directory}" "${libdir}")
            list(APPEND places "$ORIGIN/${relative}")
        endforeach()
    else()
        set(places "${CMAKE_INSTALL_PREFIX}/${TAVO_PRIVATE_LIBDIR}")
    endif()
    list(TRANSFORM places REPLACE "/$" "")
    set_target_properties(${target} PROPERTIES INSTALL_RPATH "${places}")
endfunction()

tavo_install_rpath(tavoosal "${CMAKE_INSTALL_LIBDIR}")
set_target_properties(binder PROPERTIES INSTALL_RPATH "")
install(TARGETS tavoosal
    LIBRARY DESTINATION "${CMAKE_INSTALL_LIBDIR}" COMPONENT runtime NAMELINK_COMPONENT development)
install(TARGETS binder
    LIBRARY DESTINATION "${TAVO_PRIVATE_LIBDIR}" COMPONENT runtime)

install(DIRECTORY "${PROJECT_SOURCE_DIR}/include/" DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}" COMPONENT development
    PATTERN testing EXCLUDE)
install(DIRECTORY "${PROJECT_SOURCE_DIR}/platform/linux/binder/include/" DESTINATION "${TAVO_BINDER_INCLUDEDIR}"
    COMPONENT development)

if(TARGET tavo_testing)
    install(TARGETS tavo_testing
        ARCHIVE DESTINATION "${CMAKE_INSTALL_LIBDIR}" COMPONENT testing)
    set_target_properties(tavo_private_storage PROPERTIES INSTALL_RPATH "")
    install(TARGETS tavo_private_storage
        LIBRARY DESTINATION "${TAVO_PRIVATE_LIBDIR}" COMPONENT testing)
    install(PROGRAMS "${PROJECT_BINARY_DIR}/testing/installed/tavo-private-storage"
        DESTINATION "${CMAKE_INSTALL_BINDIR}" COMPONENT testing)
    install(DIRECTORY "${PROJECT_SOURCE_DIR}/include/tavo_osal/testing" COMPONENT testing
        DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}/tavo_osal")
endif()

foreach(tool IN ITEMS tavo servicemanager)
    if(TARGET ${tool})
        set(directory "${CMAKE_INSTALL_BINDIR}")
        if(tool STREQUAL servicemanager)
            set(directory "${CMAKE_INSTALL_LIBEXECDIR}/tavoosal")  # a daemon, and the name is a common one
        endif()
        tavo_install_rpath(${tool} "${directory}")
        install(TARGETS ${tool} RUNTIME DESTINATION "${directory}" COMPONENT tools)
    endif()
endforeach()

if(TARGET tavo)
    # bash-completion loads what is named like the command.
    install(FILES "${PROJECT_SOURCE_DIR}/tools/tavo.bash" RENAME tavo
        DESTINATION "${CMAKE_INSTALL_DATAROOTDIR}/bash-completion/completions" COMPONENT tools)
endif()

# Manual pages: the tools' with the tools, what programmers read with the headers.
file(GLOB manual_pages CONFIGURE_DEPENDS "${PROJECT_SOURCE_DIR}/docs/man/*.[1-8]")
foreach(page IN LISTS manual_pages)
    string(REGEX MATCH "[1-8]$" section "${page}")
    set(component development)
    if(page MATCHES "/tavo-private-storage[.]1$")
        set(component testing)
    elseif(section MATCHES "[158]")
        set(component tools)
    endif()
    if(NOT TAVO_RELOCATABLE)
        # As Debian wants them.
        get_filename_component(name "${page}" NAME)
        execute_process(COMMAND gzip -9nc "${page}"
            OUTPUT_FILE "${PROJECT_BINARY_DIR}/${name}.gz" COMMAND_ERROR_IS_FATAL ANY)
        set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS "${page}")
        set(page "${PROJECT_BINARY_DIR}/${name}.gz")
    endif()
    install(FILES "${page}" DESTINATION "${CMAKE_INSTALL_MANDIR}/man${section}" COMPONENT ${component})
endforeach()

# find_package(tavoosal), relocatable with the prefix, and pkg-config.
get_filename_component(ANDROID_LIBRARY_DIR "${ANDROID_utils_LIBRARY}" DIRECTORY)
set(TAVO_CMAKEDIR "${CMAKE_INSTALL_LIBDIR}/cmake/tavoosal")
configure_package_config_file(packaging/tavoosal-config.cmake.in "${PROJECT_BINARY_DIR}/tavoosal-config.cmake"
    INSTALL_DESTINATION "${TAVO_CMAKEDIR}"
    PATH_VARS CMAKE_INSTALL_LIBDIR CMAKE_INSTALL_INCLUDEDIR TAVO_PRIVATE_LIBDIR TAVO_BINDER_INCLUDEDIR
    NO_CHECK_REQUIRED_COMPONENTS_MACRO)
# Before 1.0, every minor version may change the interface.
write_basic_package_version_file("${PROJECT_BINARY_DIR}/tavoosal-config-version.cmake" COMPATIBILITY SameMinorVersion)
install(FILES
    "${PROJECT_BINARY_DIR}/tavoosal-config.cmake"
    "${PROJECT_BINARY_DIR}/tavoosal-config-version.cmake"
    DESTINATION "${TAVO_CMAKEDIR}" COMPONENT development)

file(RELATIVE_PATH TAVO_PREFIX_FROM_PKGCONFIG
    "${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig" "${CMAKE_INSTALL_PREFIX}")
string(REGEX REPLACE "/$" "" TAVO_PREFIX_FROM_PKGCONFIG "${TAVO_PREFIX_FROM_PKGCONFIG}")
foreach(package IN ITEMS tavoosal tavoosal-binder tavoosal-testing)
    configure_file(packaging/${package}.pc.in "${PROJECT_BINARY_DIR}/${package}.pc" @ONLY)
    set(component development)
    if(package STREQUAL "tavoosal-testing")
        set(component testing)
    endif()
    if(NOT component STREQUAL testing OR TARGET tavo_testing)
        install(FILES "${PROJECT_BINARY_DIR}/${package}.pc"
            DESTINATION "${CMAKE_INSTALL_LIBDIR}/pkgconfig" COMPONENT ${component})
    endif()
endforeach()

include(TavoPackages)
