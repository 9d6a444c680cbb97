# The library that other programs build upon: everything below app/ in one file, shared and static. Programs of this
# project are linked with its parts, and start without it.
get_property(parts GLOBAL PROPERTY LA_PARTS)
set(objects)
foreach(part ${parts})
    list(APPEND objects $<TARGET_OBJECTS:${part}>)
endforeach()
set(headers ${CMAKE_INSTALL_INCLUDEDIR}/location-assistant-${PROJECT_VERSION_MAJOR})

function(la_installed_library target kind name)
    add_library(${target} ${kind} ${objects})
    add_library(MoreSCF::${name} ALIAS ${target})
    set_target_properties(${target} PROPERTIES OUTPUT_NAME morescf EXPORT_NAME ${name} LINKER_LANGUAGE CXX
        ARCHIVE_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/lib LIBRARY_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/lib)
    foreach(folder platform_faces morecfq morescf)
        target_include_directories(${target} INTERFACE $<BUILD_INTERFACE:${PROJECT_BINARY_DIR}/include/${folder}>)
    endforeach()
    target_include_directories(${target} INTERFACE $<INSTALL_INTERFACE:${headers}>)
    la_options(${target})
endfunction()

la_installed_library(morescf_shared SHARED morescf)
set_target_properties(morescf_shared PROPERTIES VERSION ${PROJECT_VERSION} SOVERSION ${PROJECT_VERSION_MAJOR})
# For the system's libraries behind the parts; the parts themselves are here already.
target_link_libraries(morescf_shared PRIVATE ${parts})
set(map ${PROJECT_SOURCE_DIR}/morescf/morescf.map)
target_link_options(morescf_shared PRIVATE LINKER:--version-script=${map})
set_property(TARGET morescf_shared PROPERTY LINK_DEPENDS ${map})
if(NOT LA_SANITIZE)
    target_link_options(morescf_shared PRIVATE LINKER:--no-undefined)
endif()

la_installed_library(morescf_static STATIC morescf_static)
# By their plain names: only a program that is linked so needs them.
set(behind expat icui18n icuuc mnl systemd ${CMAKE_DL_LIBS})
target_link_libraries(morescf_static INTERFACE ${behind})

install(TARGETS morescf_shared EXPORT MoreSCF
    LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT library NAMELINK_COMPONENT development)
install(TARGETS morescf_static EXPORT MoreSCF ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT development)
foreach(target platform_faces morecfq morescf)
    string(REGEX REPLACE "_faces$" "" folder ${target})
    get_target_property(names ${target} LA_PUBLIC_HEADERS)
    list(TRANSFORM names PREPEND ${PROJECT_SOURCE_DIR}/${folder}/)
    install(FILES ${names} DESTINATION ${headers}/${folder} COMPONENT development)
endforeach()

set(package ${CMAKE_INSTALL_LIBDIR}/cmake/MoreSCF)
install(EXPORT MoreSCF FILE MoreSCFConfig.cmake NAMESPACE MoreSCF:: DESTINATION ${package} COMPONENT development)
include(CMakePackageConfigHelpers)
write_basic_package_version_file(${PROJECT_BINARY_DIR}/MoreSCFConfigVersion.cmake COMPATIBILITY SameMajorVersion)
install(FILES ${PROJECT_BINARY_DIR}/MoreSCFConfigVersion.cmake DESTINATION ${package} COMPONENT development)

# The prefix is found from where the file lies, so that the installation may be moved.
file(RELATIVE_PATH up ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig ${CMAKE_INSTALL_PREFIX})
string(REGEX REPLACE "/$" "" up ${up})
list(TRANSFORM behind PREPEND -l OUTPUT_VARIABLE behind_flags)
list(JOIN behind_flags " " behind_flags)
configure_file(morescf/morescf.pc.in morescf.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/morescf.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT development)
