# la_library(NAME SOURCES ... [LINK ...]) and la_program(NAME SOURCES ... [LINK ...]): a target with this
# project's warnings and sanitizers. What is below app/ becomes a part of the library that is installed (Library.cmake).
#
# la_public_headers(NAME FOLDER HEADER ...): what other folders may include of a library. The headers are linked
# into a directory of their own, and only that directory travels with the target, never the project's root: a
# folder that may not see a header cannot include it. la_sees_internals(NAME) adds the root, for the platform's
# own folders and their tests.

function(la_options target)
    target_compile_options(${target} PRIVATE -Wall -Wextra -Wpedantic -Wshadow -Wconversion -Wsign-conversion
        $<$<COMPILE_LANGUAGE:CXX>:-Wnon-virtual-dtor> $<$<COMPILE_LANGUAGE:CXX>:-Wold-style-cast>
        -Wcast-qual -Wformat=2 -Wundef -Wimplicit-fallthrough
        $<$<BOOL:${LA_WARNINGS_AS_ERRORS}>:-Werror>
        # Before 13 the compiler sees copies in std::string's operator+ that cannot be.
        $<$<AND:$<NOT:$<CONFIG:Debug>>,$<CXX_COMPILER_ID:GNU>,$<VERSION_LESS:$<CXX_COMPILER_VERSION>,13>>:-Wno-restrict>)
    if(LA_SANITIZE)
        target_compile_options(${target} PRIVATE -fsanitize=${LA_SANITIZE} -fno-sanitize-recover=all
            -fno-omit-frame-pointer)
        target_link_options(${target} PRIVATE -fsanitize=${LA_SANITIZE})
    else()
        target_compile_options(${target} PRIVATE -fstack-protector-strong)
        # Whoever builds for a distribution may have chosen another level.
        if(NOT CMAKE_CXX_FLAGS MATCHES _FORTIFY_SOURCE)
            target_compile_definitions(${target} PRIVATE $<$<NOT:$<CONFIG:Debug>>:_FORTIFY_SOURCE=2>)
        endif()
        target_link_options(${target} PRIVATE -Wl,-z,relro,-z,now)
    endif()
endfunction()

function(la_library target)
    cmake_parse_arguments(LA "" "" "SOURCES;LINK" ${ARGN})
    add_library(${target} STATIC ${LA_SOURCES})
    set_property(GLOBAL APPEND PROPERTY LA_PARTS ${target})
    target_link_libraries(${target} PUBLIC ${LA_LINK})
    la_options(${target})
endfunction()

function(la_program target)
    cmake_parse_arguments(LA "" "" "SOURCES;LINK" ${ARGN})
    add_executable(${target} ${LA_SOURCES})
    target_link_libraries(${target} PRIVATE ${LA_LINK})
    la_options(${target})
endfunction()

function(la_public_headers target folder)
    set(directory ${PROJECT_BINARY_DIR}/include/${target})
    file(MAKE_DIRECTORY ${directory}/${folder})
    foreach(header ${ARGN})
        file(CREATE_LINK ${PROJECT_SOURCE_DIR}/${folder}/${header} ${directory}/${folder}/${header} SYMBOLIC)
    endforeach()
    set_property(TARGET ${target} PROPERTY LA_PUBLIC_HEADERS ${ARGN})
    get_target_property(type ${target} TYPE)
    if(type STREQUAL "INTERFACE_LIBRARY")
        target_include_directories(${target} INTERFACE ${directory})
    else()
        target_include_directories(${target} PUBLIC ${directory})
    endif()
endfunction()

function(la_sees_internals target)
    target_include_directories(${target} PRIVATE ${PROJECT_SOURCE_DIR})
endfunction()
