# What an installed system holds, and the target 'product' that builds just that.
include(CMakePackageConfigHelpers)
set(package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/iscsiwebapi)

add_custom_target(product DEPENDS iscsiwebapi)
if(TARGET iscsictl_documents)
    add_dependencies(product iscsictl_documents)
endif()
function(install_programs destination)
    foreach(target ${ARGN})
        if(TARGET ${target})
            install(TARGETS ${target} RUNTIME DESTINATION ${destination})
            file(RELATIVE_PATH to_libraries /prefix/${destination} /prefix/${CMAKE_INSTALL_LIBDIR})
            set_target_properties(${target} PROPERTIES INSTALL_RPATH "$ORIGIN/${to_libraries}")
            add_dependencies(product ${target})
        endif()
    endforeach()
endfunction()

# An installed tree finds its own libraries, wherever it lies; a package build sets CMAKE_SKIP_INSTALL_RPATH.
set_target_properties(iscsiwebapi PROPERTIES INSTALL_RPATH "$ORIGIN")
install(TARGETS iscsiwebapi EXPORT iscsiwebapi LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR})
if(TARGET norvhost)
    # Exported because programs that link libiscsiwebapi.so must find it; nobody links it by name.
    install(TARGETS norvhost EXPORT iscsiwebapi LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} NAMELINK_SKIP)
    install_programs(${CMAKE_INSTALL_BINDIR} iscsictl)
    install_programs(${CMAKE_INSTALL_SBINDIR} iscsi-host iscsi-portald)
    install_programs(norv/sbin epck) # below the prefix /usr this is where the library looks for it
    install(FILES host/systemd/iscsi-host-schedule.service host/systemd/iscsi-host-schedule.timer
        host/systemd/iscsi-webapi.service DESTINATION lib/systemd/system)
    set(webapi_folder ${CMAKE_INSTALL_LIBEXECDIR}/iscsi-host/webapi)
    install_programs(${webapi_folder}/cgi iscsi-webapi)
    install(FILES webapi/lighttpd/iscsi-webapi.conf DESTINATION ${webapi_folder})
    install(DIRECTORY webapi/lighttpd/errors DESTINATION ${webapi_folder})
    install(FILES ${PROJECT_BINARY_DIR}/webapi/openapi/openapi.json DESTINATION ${CMAKE_INSTALL_DATADIR}/iscsi-host)
    add_dependencies(product openapi)
    # The library's node configuration file lives here; it holds tokens.
    install(DIRECTORY DESTINATION norv/etc DIRECTORY_PERMISSIONS OWNER_READ OWNER_WRITE OWNER_EXECUTE)
endif()

target_include_directories(iscsiwebapi INTERFACE
    $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>
    $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}/iscsiwebapi>)
install(DIRECTORY include/iscsiwebapi DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} FILES_MATCHING PATTERN "*.h")
install(DIRECTORY platform DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/iscsiwebapi FILES_MATCHING PATTERN "*.h")

install(EXPORT iscsiwebapi NAMESPACE iscsiwebapi:: FILE iscsiwebapiTargets.cmake DESTINATION ${package_dir})
configure_package_config_file(cmake/iscsiwebapiConfig.cmake.in iscsiwebapiConfig.cmake INSTALL_DESTINATION ${package_dir})
write_basic_package_version_file(iscsiwebapiConfigVersion.cmake COMPATIBILITY SameMajorVersion)
file(RELATIVE_PATH pc_to_prefix /prefix/${CMAKE_INSTALL_LIBDIR}/pkgconfig /prefix)
configure_file(cmake/iscsiwebapi.pc.in iscsiwebapi.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/iscsiwebapiConfig.cmake ${PROJECT_BINARY_DIR}/iscsiwebapiConfigVersion.cmake
    DESTINATION ${package_dir})
install(FILES ${PROJECT_BINARY_DIR}/iscsiwebapi.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
