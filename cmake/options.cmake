# Compiler and linker options of all our targets.
add_library(project_options INTERFACE)
target_compile_options(project_options INTERFACE
    -Wall -Wextra -Wpedantic $<$<CXX_COMPILER_ID:GNU>:-Wshadow=local> -Wconversion -Wformat=2 -Wundef
    # Log lines carry paths relative to the source root.
    "-fmacro-prefix-map=${PROJECT_SOURCE_DIR}/=")
if(ISCSIWEBAPI_WERROR)
    target_compile_options(project_options INTERFACE -Werror)
endif()
if(ISCSIWEBAPI_SANITIZE)
    target_compile_options(project_options INTERFACE
        -fsanitize=address,undefined -fno-sanitize-recover=all -fno-omit-frame-pointer)
    target_link_options(project_options INTERFACE -fsanitize=address,undefined)
    target_sources(project_options INTERFACE
        $<$<STREQUAL:$<TARGET_PROPERTY:TYPE>,EXECUTABLE>:${PROJECT_SOURCE_DIR}/cmake/sanitizers.cpp>)
    # A sanitized shared library leaves the runtime to the program that loads it.
    set(ISCSIWEBAPI_ZDEFS "")
else()
    set(ISCSIWEBAPI_ZDEFS -Wl,-z,defs)
endif()
if(ISCSIWEBAPI_FUZZ)
    target_compile_options(project_options INTERFACE -fsanitize=fuzzer-no-link)
endif()
