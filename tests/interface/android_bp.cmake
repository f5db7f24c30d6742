# Android.bp describes the same library and the same tests. Included once all of the tests are known.
find_program(PYTHON3 python3 REQUIRED)

# json_list(VARIABLE ENTRY...): the entries as a JSON list of strings; those of this project's as paths in it.
function(json_list variable)
    set(json "")
    foreach(entry IN LISTS ARGN)
        string(REPLACE "${PROJECT_SOURCE_DIR}/" "" entry "${entry}")
        string(REPLACE "\"" "\\\"" entry "${entry}")
        list(APPEND json "\"${entry}\"")
    endforeach()
    list(JOIN json ", " json)
    set(${variable} "[${json}]" PARENT_SCOPE)
endfunction()

# json_sources(VARIABLE TARGET): the target's own sources, as a JSON list of paths in the project.
function(json_sources variable target)
    get_target_property(folder ${target} SOURCE_DIR)
    get_target_property(sources ${target} SOURCES)
    list(TRANSFORM sources PREPEND "${folder}/" REGEX "^[^/]")
    set(paths "")
    foreach(source IN LISTS sources)
        get_filename_component(source "${source}" ABSOLUTE)
        list(APPEND paths "${source}")
    endforeach()
    json_list(json ${paths})
    set(${variable} "${json}" PARENT_SCOPE)
endfunction()

# The library.
json_sources(library_sources tavoosal)
get_target_property(sources tavoosal SOURCES)
set(source_options "")
foreach(source IN LISTS sources)
    get_source_file_property(options "${PROJECT_SOURCE_DIR}/${source}" DIRECTORY "${PROJECT_SOURCE_DIR}" COMPILE_OPTIONS)
    if(options)
        json_list(options ${options})
        list(APPEND source_options "\"${source}\": ${options}")
    endif()
endforeach()
list(JOIN source_options ", " source_options)

# Of the folders, those that count while building, in either system from the project's own.
get_target_property(folders tavoosal INCLUDE_DIRECTORIES)
get_target_property(public_folders tavoosal INTERFACE_INCLUDE_DIRECTORIES)
foreach(list IN ITEMS folders public_folders)
    list(FILTER ${list} EXCLUDE REGEX "INSTALL_INTERFACE")
    list(TRANSFORM ${list} REPLACE "^\\$<BUILD_INTERFACE:(.*)>$" "\\1")
    list(TRANSFORM ${list} REPLACE "^${PROJECT_SOURCE_DIR}$" ".")
    json_list(${list} ${${list}})
endforeach()
get_target_property(definitions tavoosal COMPILE_DEFINITIONS)
# The device's, whatever this build's is.
list(TRANSFORM definitions REPLACE "^TAVO_STORAGE_ROOT=.*" "TAVO_STORAGE_ROOT=\"/sdcard\"")
json_list(definitions ${definitions})
get_target_property(warnings tavo_compile INTERFACE_COMPILE_OPTIONS)
list(TRANSFORM warnings REPLACE "^\\$<\\$<COMPILE_LANGUAGE:CXX>:(.*)>$" "\\1")
json_list(warnings ${warnings})
get_target_property(version_scripts tavoosal LINK_OPTIONS)
list(FILTER version_scripts INCLUDE REGEX "version-script=")
list(TRANSFORM version_scripts REPLACE ".*version-script=" "")
json_list(version_scripts ${version_scripts})

# The tests, but those of what Android has and Linux lacks, of every platform call failing (glibc's), of the command, of the testing kit, and what reads JSON.
json_sources(support tavo_test_support)
json_sources(kit tavo_testing)
get_property(names GLOBAL PROPERTY TAVO_TESTS)
set(tests "")
foreach(name IN LISTS names)
    get_target_property(folder ${name} SOURCE_DIR)
    get_target_property(libraries ${name} LINK_LIBRARIES)
    if(NOT folder MATCHES "/tests/(faults|platform|testing|tools)" AND NOT libraries MATCHES "json")
        json_sources(sources ${name})
        list(APPEND tests "\n    \"${name}\": ${sources}")
    endif()
endforeach()
list(JOIN tests "," tests)

set(targets "${CMAKE_CURRENT_BINARY_DIR}/interface/targets.json")
file(CONFIGURE OUTPUT "${targets}" @ONLY CONTENT [[
{
  "library": {
    "sources": @library_sources@,
    "source_options": {@source_options@},
    "folders": @folders@,
    "public_folders": @public_folders@,
    "definitions": @definitions@,
    "warnings": @warnings@,
    "version_scripts": @version_scripts@
  },
  "support": @support@,
  "kit": @kit@,
  "tests": {@tests@
  }
}
]])

set(check "${PYTHON3}" "${CMAKE_CURRENT_SOURCE_DIR}/interface/check_android_bp.py")
set(android_bp "${PROJECT_SOURCE_DIR}/Android.bp")
add_test(NAME interface.android_bp COMMAND ${check} "${android_bp}" "${targets}")

# The check with one fault at a time: a text of the file that is there once, and what stands there instead.
set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS "${android_bp}")
function(android_bp_fault name text instead message)
    file(READ "${android_bp}" content)
    string(REPLACE "${text}" "${instead}" wrong "${content}")
    if(wrong STREQUAL content)
        message(FATAL_ERROR "Android.bp has no ${text} to make a fault of")
    endif()
    set(file "${CMAKE_CURRENT_BINARY_DIR}/interface/${name}.bp")
    file(WRITE "${file}" "${wrong}")
    add_test(NAME interface.android_bp.notices_${name} COMMAND ${check} "${file}" "${targets}")
    set_tests_properties(interface.android_bp.notices_${name} PROPERTIES PASS_REGULAR_EXPRESSION "${message}")
endfunction()
android_bp_fault(a_source_of_cmakes_alone
    [["util/list.cpp",]] "" "library: only CMake has util/list.cpp")
android_bp_fault(a_source_of_its_own
    [["util/list.cpp",]] [["util/list.cpp", "util/queue.cpp",]] "library: only Android.bp has util/queue.cpp")
# The same library, but one file of it built like the others.
android_bp_fault(a_file_without_its_options
    "\"util/string.cpp\",\n    ],\n    cflags" "],\n    enabled: true, cflags"
    "files with options of their own: only CMake has util/string.cpp")
android_bp_fault(other_options
    [["-fasynchronous-unwind-tables",]] "" "options of util/string.cpp: only CMake has -fasynchronous-unwind-tables")
android_bp_fault(another_folder
    [[local_include_dirs: ["."],]] [[local_include_dirs: ["log"],]] "libtavoosal: folders: only Android.bp has log")
android_bp_fault(another_map
    [["libtavoosal.map"]] [["libtavoosal.map.txt"]] "export map: only CMake has libtavoosal.map")
android_bp_fault(a_warning_less
    [["-Wshadow",]] "" "libtavoosal: warnings: only CMake has -Wshadow")
android_bp_fault(a_test_less
    [[name: "tavoosal_list_test"]] [[name: "tavoosal_queue_test"]] "tests: only CMake has tavoosal_list_test")
android_bp_fault(a_source_of_a_test_less
    [["tests/net/ipv4_test.cpp",]] "" "network_test: only CMake has tests/net/ipv4_test.cpp")
