# Debian packages: `cpack`, or scripts/package. Three of them: whoever runs a program that was built with libmorescf-dev needs
# the shared library and neither headers nor the tool, which does without it.
set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME location-assistant)
# Each package has its own.
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_PACKAGE_DIRECTORY ${PROJECT_BINARY_DIR}/packages)
set(CPACK_PACKAGE_CHECKSUM SHA256)
set(CPACK_STRIP_FILES ON)
set(CPACK_INSTALL_DEFAULT_DIRECTORY_PERMISSIONS
    OWNER_READ OWNER_WRITE OWNER_EXECUTE GROUP_READ GROUP_EXECUTE WORLD_READ WORLD_EXECUTE)
set(CPACK_COMPONENTS_ALL tool library development)
set(CPACK_PRE_BUILD_SCRIPTS ${PROJECT_SOURCE_DIR}/cmake/PackageFiles.cmake)
set(CPACK_LA_PACKAGING ${PROJECT_SOURCE_DIR}/packaging)

# As Debian's own tools take it from whoever builds.
set(maintainer "$ENV{DEBFULLNAME} <$ENV{DEBEMAIL}>")
if(maintainer STREQUAL " <>")
    set(maintainer "Location Assistant developers <developers@location-assistant.example>")
endif()
set(CPACK_PACKAGE_CONTACT "${maintainer}")
set(CPACK_DEBIAN_PACKAGE_MAINTAINER "${maintainer}")

set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY "=")
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)

set(CPACK_DEBIAN_TOOL_PACKAGE_NAME location-assistant)
set(CPACK_DEBIAN_TOOL_PACKAGE_SECTION net)
set(CPACK_DEBIAN_TOOL_PACKAGE_RECOMMENDS "busybox, libcurl3-gnutls | libcurl4")
set(CPACK_DEBIAN_TOOL_PACKAGE_SUGGESTS "network-manager, xdg-utils")
set(CPACK_DEBIAN_TOOL_PACKAGE_CONTROL_EXTRA ${PROJECT_SOURCE_DIR}/packaging/prerm ${PROJECT_SOURCE_DIR}/packaging/postrm)
set(CPACK_DEBIAN_TOOL_DESCRIPTION "move this computer onto a wireless printer's network and back
A wireless printer that nobody has configured yet offers a small wireless
network of its own. location-assistant moves the computer onto that network,
and afterwards back to its own, exactly as it was. It works with
NetworkManager, with wpa_supplicant and without either.")

set(CPACK_DEBIAN_LIBRARY_PACKAGE_NAME libmorescf${PROJECT_VERSION_MAJOR})
set(CPACK_DEBIAN_LIBRARY_PACKAGE_SECTION libs)
# For an address by DHCP without NetworkManager the library calls the program that the tool brings.
set(CPACK_DEBIAN_LIBRARY_PACKAGE_RECOMMENDS "location-assistant (= ${PROJECT_VERSION})")
set(CPACK_DEBIAN_LIBRARY_PACKAGE_CONTROL_EXTRA ${PROJECT_SOURCE_DIR}/packaging/triggers)
set(CPACK_DEBIAN_LIBRARY_DESCRIPTION "network locations: shared library
A location is a named, complete network configuration, one of which is
current. This library reads, makes and changes locations, and makes one
of them the current one. It is what location-assistant is made of.")

set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_NAME libmorescf-dev)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS "libmorescf${PROJECT_VERSION_MAJOR} (= ${PROJECT_VERSION})")
# What a program needs that is linked with the static library.
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SUGGESTS "libexpat1-dev, libicu-dev, libmnl-dev, libsystemd-dev")
set(CPACK_DEBIAN_DEVELOPMENT_DESCRIPTION "network locations: headers and static library
A location is a named, complete network configuration, one of which is
current. This package holds what programs in C and C++ need to be built
with libmorescf: headers, the static library, files for pkg-config and
CMake, a manual page and examples.")

include(CPack)
