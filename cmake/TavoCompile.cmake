# The compile settings every target of this project shares, as one interface target.
add_library(tavo_compile INTERFACE)
target_compile_features(tavo_compile INTERFACE cxx_std_17 c_std_11)
# POSIX and the GNU additions, in C as well: C++ compilers say so by themselves.
target_compile_definitions(tavo_compile INTERFACE $<$<COMPILE_LANGUAGE:C>:_GNU_SOURCE>)
target_compile_options(tavo_compile INTERFACE
    -Wall -Wextra -Wconversion -Wshadow -Wformat=2 -Wno-format-nonliteral -Werror
    -fvisibility=hidden
    $<$<COMPILE_LANGUAGE:CXX>:-fvisibility-inlines-hidden>)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_C_EXTENSIONS OFF)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)
# The platform's libraries live in a folder of their own, so everything linked to them needs a RUNPATH.
set(CMAKE_INSTALL_RPATH_USE_LINK_PATH ON)

find_package(Threads REQUIRED)
target_link_libraries(tavo_compile INTERFACE Threads::Threads)

if(TAVO_SANITIZE)
    # On every target, whether it asks for the warnings above or not: half-instrumented programs lie.
    add_compile_options(-fsanitize=${TAVO_SANITIZE} -fno-omit-frame-pointer -fno-sanitize-recover=all)
    add_link_options(-fsanitize=${TAVO_SANITIZE})
    if(TAVO_SANITIZE MATCHES "undefined")
        # It opens a pipe to see whether an object can be read, so it takes any for none where descriptors have run out, as
        # they do in tests.
        add_compile_options(-fno-sanitize=vptr)
    endif()
endif()

# What makes mistakes in the shared libraries harder to use against them. Only of what the toolchain has: branch protection
# exists for some processors only.
include(CheckCXXCompilerFlag)
check_cxx_compiler_flag(-fcf-protection=full TAVO_HAS_CF_PROTECTION)
add_library(tavo_hardening INTERFACE)
target_compile_options(tavo_hardening INTERFACE
    -fstack-protector-strong
    $<$<BOOL:${TAVO_HAS_CF_PROTECTION}>:-fcf-protection=full>)
# The C library's checked calls need an optimiser, and sanitizers see more without them.
target_compile_options(tavo_hardening INTERFACE
    $<$<NOT:$<CONFIG:Debug,>>:-U_FORTIFY_SOURCE>
    $<$<NOT:$<CONFIG:Debug,>>:-D_FORTIFY_SOURCE=3>)
# Everything is bound when the library is loaded and read-only from then on; code and data lie on pages of their own; no
# stack is executable, and no code is changed by the loader.
target_link_options(tavo_hardening INTERFACE
    LINKER:-z,relro LINKER:-z,now LINKER:-z,noexecstack LINKER:-z,separate-code LINKER:-z,text)

# tavo_count(TARGET): './dev coverage' counts what of it is run, in all processes together, see tests/coverage/counters.cpp.
function(tavo_count target)
    if(NOT TAVO_COVERAGE)
        return()
    endif()
    set(folder "${PROJECT_SOURCE_DIR}/tests/coverage")
    # Threads share the counters.
    target_compile_options(${target} PRIVATE --coverage -fprofile-update=atomic -fdata-sections)
    get_target_property(type ${target} TYPE)
    if(type STREQUAL "OBJECT_LIBRARY")
        return() # linked into another
    endif()
    add_library(${target}_counters OBJECT "${folder}/counters.cpp")
    target_link_libraries(${target}_counters PRIVATE tavo_compile)
    target_compile_definitions(${target}_counters PRIVATE TAVO_COUNTERS="${PROJECT_BINARY_DIR}/counters/${target}")
    target_sources(${target} PRIVATE $<TARGET_OBJECTS:${target}_counters>)
    target_link_options(${target} PRIVATE --coverage LINKER:-T,${folder}/counters.ld LINKER:--wrap=__gcov_exit)
    set_property(TARGET ${target} APPEND PROPERTY LINK_DEPENDS "${folder}/counters.ld")
    file(MAKE_DIRECTORY "${PROJECT_BINARY_DIR}/counters")
endfunction()

find_program(CCACHE ccache)
if(CCACHE)
    set(CMAKE_C_COMPILER_LAUNCHER ${CCACHE})
    set(CMAKE_CXX_COMPILER_LAUNCHER ${CCACHE})
endif()
