# What `cmake --install` lays down: the public headers, the library with its version, a CMake package and a pkg-config
# file. The tool installs itself.

foreach(header IN LISTS kernel_headers)
    cmake_path(RELATIVE_PATH header BASE_DIRECTORY "${PROJECT_SOURCE_DIR}/Libraries")
    if(header MATCHES "/internal/")
        continue()
    endif()
    cmake_path(GET header PARENT_PATH folder)
    install(FILES "Libraries/${header}" DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}/${folder}")
endforeach()
if(EXISTS "${PROJECT_SOURCE_DIR}/Resources")
    install(DIRECTORY Resources/ DESTINATION "${CMAKE_INSTALL_DATADIR}/libkernel" PATTERN "*.py" EXCLUDE PATTERN "README.md" EXCLUDE PATTERN "__pycache__" EXCLUDE)
endif()

install(TARGETS libkernel EXPORT libkernel
    LIBRARY DESTINATION "${CMAKE_INSTALL_LIBDIR}" ARCHIVE DESTINATION "${CMAKE_INSTALL_LIBDIR}")

set(package_dir "${CMAKE_INSTALL_LIBDIR}/cmake/libkernel")
install(EXPORT libkernel NAMESPACE libkernel:: FILE libkernelTargets.cmake DESTINATION "${package_dir}")
configure_package_config_file(cmake/libkernelConfig.cmake.in "${PROJECT_BINARY_DIR}/libkernelConfig.cmake"
    INSTALL_DESTINATION "${package_dir}")
# Before version 1 a minor version may change the interface.
write_basic_package_version_file("${PROJECT_BINARY_DIR}/libkernelConfigVersion.cmake" COMPATIBILITY SameMinorVersion)
install(FILES "${PROJECT_BINARY_DIR}/libkernelConfig.cmake" "${PROJECT_BINARY_DIR}/libkernelConfigVersion.cmake"
    DESTINATION "${package_dir}")

if(BUILD_SHARED_LIBS)
    set(pc_libs "-lkernel")
    set(pc_cflags "")
    set(pc_requires "")
    set(pc_requires_private "icu-i18n icu-uc zlib libcrypto")
else()
    set(pc_libs "-Wl,--whole-archive -lkernel -Wl,--no-whole-archive -lstemmer -pthread")
    set(pc_cflags "-DKERNEL_STATIC")
    set(pc_requires "icu-i18n icu-uc zlib libcrypto")
    set(pc_requires_private "")
endif()
# The file says where it lies, so that the prefix may be moved.
file(RELATIVE_PATH pc_prefix "/${CMAKE_INSTALL_LIBDIR}/pkgconfig" "/")
cmake_path(APPEND pc_prefix "." OUTPUT_VARIABLE pc_prefix)
string(REGEX REPLACE "/+\\.?$" "" pc_prefix "${pc_prefix}")
configure_file(cmake/libkernel.pc.in "${PROJECT_BINARY_DIR}/libkernel.pc" @ONLY)
install(FILES "${PROJECT_BINARY_DIR}/libkernel.pc" DESTINATION "${CMAKE_INSTALL_LIBDIR}/pkgconfig")
