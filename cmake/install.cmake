# What an installed system holds, and the target 'product' that builds just that.
include(CMakePackageConfigHelpers)
set(package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/iscsiwebapi)

add_custom_target(product)
function(install_product destination)
    foreach(target ${ARGN})
        if(TARGET ${target})
            install(TARGETS ${target} RUNTIME DESTINATION ${destination} LIBRARY DESTINATION ${destination})
            add_dependencies(product ${target})
        endif()
    endforeach()
endfunction()

if(ISCSIWEBAPI_PLATFORM STREQUAL "host")
    install_product(${CMAKE_INSTALL_LIBDIR} norvhost)
    install_product(${CMAKE_INSTALL_BINDIR} iscsictl)
    install_product(${CMAKE_INSTALL_SBINDIR} iscsi-host iscsi-portald)
    install_product(norv/sbin epck) # with the prefix /usr where the library looks for it
endif()

install(TARGETS iscsiwebapi EXPORT iscsiwebapi LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR})
add_dependencies(product iscsiwebapi)
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
