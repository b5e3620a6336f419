# What is installed where, below any prefix:
#
#     bin/appsync                     lib/appsync/appsync-plugin.so
#     include/appsync/                the headers of platform/, client/ (in part), system/, simulation/, checked/,
#                                     recording/ and contract/
#     lib/libappsync_*.a              with lib/cmake/appsync/ and lib/pkgconfig/
#     share/doc/appsync/              share/man/, and completions where bash, zsh and fish look for them
#
# Nothing of it names the prefix, so an installed tree may be moved.

include(GNUInstallDirs)
include(CMakePackageConfigHelpers)

set(config_place "${CMAKE_INSTALL_LIBDIR}/cmake/appsync")
set(header_place "${CMAKE_INSTALL_INCLUDEDIR}/appsync")

# Installs the library appsync_NAME as appsync::NAME, for find_package and pkg-config. REQUIRES are what its pkg-config
# file names.
function(appsync_install_library name description requires)
    set(target appsync_${name})
    set_target_properties(${target} PROPERTIES EXPORT_NAME ${name})
    add_library(appsync::${name} ALIAS ${target})
    install(TARGETS ${target} EXPORT appsync-${name} ARCHIVE DESTINATION "${CMAKE_INSTALL_LIBDIR}" COMPONENT dev)
    install(EXPORT appsync-${name} FILE appsync-${name}-targets.cmake NAMESPACE appsync::
            DESTINATION "${config_place}" COMPONENT dev)
    set(pc_place "${CMAKE_INSTALL_LIBDIR}/pkgconfig")
    file(RELATIVE_PATH pc_to_prefix "/${pc_place}" "/")
    configure_file("${PROJECT_SOURCE_DIR}/cmake/appsync.pc.in" "${PROJECT_BINARY_DIR}/appsync-${name}.pc" @ONLY)
    install(FILES "${PROJECT_BINARY_DIR}/appsync-${name}.pc" DESTINATION "${pc_place}" COMPONENT dev)
endfunction()

appsync_install_library(platform "what the appsync plug-in and a device share" "")
appsync_install_library(plugin "the appsync plug-in" "appsync-platform")
appsync_install_library(system "files, queues and property lists for appsync's plug-in" "appsync-platform pugixml")
appsync_install_library(simulation "a device in memory for appsync's plug-in" "appsync-platform")
appsync_install_library(checked "what tells of broken contracts while appsync's plug-in runs" "appsync-platform")
appsync_install_library(recording "recordings of sessions with appsync's plug-in" "appsync-platform")

set(folders platform system simulation contract/forwarding checked recording) # checked/ includes the forwarding wrappers
if(APPSYNC_CONTRACT)
    appsync_install_library(contract "what proves a device for appsync's plug-in" "appsync-plugin gmock gtest")
    list(APPEND folders contract)
endif()
foreach(folder IN LISTS folders)
    install(DIRECTORY "${PROJECT_SOURCE_DIR}/${folder}/" DESTINATION "${header_place}/${folder}" COMPONENT dev
            FILES_MATCHING PATTERN "*.h")
endforeach()
# What AppsClient.h includes, and the paths that a host needs.
install(FILES client/AppsClient.h client/ItemMap.h client/Log.h client/LogFormat.h client/Paths.h
              client/SharedIdentifierSet.h client/TodoList.h
        DESTINATION "${header_place}/client" COMPONENT dev)

configure_package_config_file("${PROJECT_SOURCE_DIR}/cmake/appsyncConfig.cmake.in"
                              "${PROJECT_BINARY_DIR}/appsyncConfig.cmake" INSTALL_DESTINATION "${config_place}")
write_basic_package_version_file("${PROJECT_BINARY_DIR}/appsyncConfigVersion.cmake" COMPATIBILITY SameMinorVersion)
install(FILES "${PROJECT_BINARY_DIR}/appsyncConfig.cmake" "${PROJECT_BINARY_DIR}/appsyncConfigVersion.cmake"
        DESTINATION "${config_place}" COMPONENT dev)

install(TARGETS appsync_module LIBRARY DESTINATION "${CMAKE_INSTALL_LIBDIR}/appsync" COMPONENT command)
if(APPSYNC_COMMAND)
    install(TARGETS appsync RUNTIME DESTINATION "${CMAKE_INSTALL_BINDIR}" COMPONENT command)
    # Not there where only some of the targets were built.
    set(shell "${PROJECT_BINARY_DIR}/shell")
    install(DIRECTORY "${shell}/man1" "${shell}/man5" DESTINATION "${CMAKE_INSTALL_MANDIR}" COMPONENT command OPTIONAL)
    install(FILES "${shell}/appsync" DESTINATION "${CMAKE_INSTALL_DATADIR}/bash-completion/completions"
            COMPONENT command OPTIONAL)
    install(FILES "${shell}/_appsync" COMPONENT command OPTIONAL
            DESTINATION "${CMAKE_INSTALL_DATADIR}/zsh/$<IF:$<BOOL:${APPSYNC_PACKAGES}>,vendor-completions,site-functions>")
    install(FILES "${shell}/appsync.fish" DESTINATION "${CMAKE_INSTALL_DATADIR}/fish/vendor_completions.d"
            COMPONENT command OPTIONAL)
endif()
install(DIRECTORY "${PROJECT_SOURCE_DIR}/docs/" DESTINATION "${CMAKE_INSTALL_DOCDIR}/docs" COMPONENT doc)
# What scripts/docs has put there; scripts/package has it do so.
install(DIRECTORY "${PROJECT_BINARY_DIR}/reference/" DESTINATION "${CMAKE_INSTALL_DOCDIR}/reference" COMPONENT doc
        OPTIONAL)
install(DIRECTORY "${PROJECT_SOURCE_DIR}/examples" DESTINATION "${CMAKE_INSTALL_DOCDIR}" COMPONENT doc)
install(FILES README.md CHANGELOG.md LICENSE DESTINATION "${CMAKE_INSTALL_DOCDIR}" COMPONENT doc)
