# Debian packages of what cmake/AppsyncInstall.cmake installs: appsync (command and module), libappsync-dev,
# libappsync-doc. scripts/package makes them.

set(APPSYNC_MAINTAINER "The appsync authors <appsync@localhost>" CACHE STRING "Who publishes the Debian packages")

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME appsync)
set(CPACK_PACKAGE_VERSION "${PROJECT_VERSION}")
set(CPACK_PACKAGE_CONTACT "${APPSYNC_MAINTAINER}")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_ALL command dev doc)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_RELEASE 1)
set(CPACK_DEBIAN_COMMAND_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)

set(CPACK_DEBIAN_COMMAND_PACKAGE_NAME appsync)
set(CPACK_DEBIAN_COMMAND_PACKAGE_SECTION utils)
set(CPACK_DEBIAN_COMMAND_PACKAGE_DEPENDS fonts-dejavu-core)
set(CPACK_COMPONENT_COMMAND_DESCRIPTION "keeps the applications of a device in step with a folder of packages
The command, which holds a whole reference device, and the plug-in as a module
that a sync daemon loads.")

set(CPACK_DEBIAN_DEV_PACKAGE_NAME libappsync-dev)
set(CPACK_DEBIAN_DEV_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEV_PACKAGE_DEPENDS libpugixml-dev)
set(CPACK_DEBIAN_DEV_PACKAGE_SUGGESTS "libgtest-dev, libgmock-dev")
set(CPACK_COMPONENT_DEV_DESCRIPTION "libraries and headers for a device of one's own
The plug-in, and what a device may be made of: files, queues and property
lists for Linux, a device in memory to test with, and the kit that proves one's
own (with GoogleTest).")

set(CPACK_DEBIAN_DOC_PACKAGE_NAME libappsync-doc)
set(CPACK_DEBIAN_DOC_PACKAGE_SECTION doc)
set(CPACK_DEBIAN_DOC_PACKAGE_ARCHITECTURE all)
set(CPACK_COMPONENT_DOC_DESCRIPTION "documents of appsync
How it is built and used, how it is brought to a device, and the formats that
it reads and writes.")

# What every Debian package has: whose it is, and what has changed; compressed, like the pages of the manual.
set(changelog "${PROJECT_BINARY_DIR}/changelog.Debian")
string(TIMESTAMP now "%a, %d %b %Y %H:%M:%S +0000" UTC)
file(WRITE "${changelog}" "appsync (${PROJECT_VERSION}-1) unstable; urgency=medium\n\n  * See CHANGELOG.md.\n\n"
     " -- ${CPACK_PACKAGE_CONTACT}  ${now}\n")
execute_process(COMMAND gzip -9nf "${changelog}" COMMAND_ERROR_IS_FATAL ANY)
foreach(pair command:appsync dev:libappsync-dev doc:libappsync-doc)
    string(REPLACE ":" ";" pair "${pair}")
    list(GET pair 0 component)
    list(GET pair 1 package)
    install(FILES LICENSE DESTINATION "share/doc/${package}" RENAME copyright COMPONENT ${component})
    install(FILES "${changelog}.gz" DESTINATION "share/doc/${package}" COMPONENT ${component})
endforeach()
install(CODE [[
    file(GLOB pages "$ENV{DESTDIR}${CMAKE_INSTALL_PREFIX}/share/man/man?/*.?")
    execute_process(COMMAND gzip -9nf ${pages} COMMAND_ERROR_IS_FATAL ANY)
]] COMPONENT command)

include(CPack)
