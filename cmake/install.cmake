# Install rules, the CMake package (find_package(usbadapter) gives
# usbadapter::usbadapter) and the Debian package (cpack -G DEB in a build dir).
include(CMakePackageConfigHelpers)

set(USBADAPTER_CMAKE_DIR ${CMAKE_INSTALL_LIBDIR}/cmake/usbadapter)
set(USBADAPTER_JAR_DIR ${CMAKE_INSTALL_DATADIR}/java)

# Consumers see the bridge records with the sizes this library was built with.
target_include_directories(usbadapter INTERFACE $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>)
target_compile_definitions(usbadapter INTERFACE
  "$<INSTALL_INTERFACE:WINDOW_DATA_SIZE=${USBADAPTER_WINDOW_DATA_SIZE};DEV_ID_MAX_SIZE=${USBADAPTER_DEV_ID_MAX_SIZE}>")

set(lib_targets usbadapter)
if(NOT CMAKE_CROSSCOMPILING)
  # On a PC nothing else provides the platform services the library needs at
  # load time: the stand-ins ship with it, found next to it whatever the prefix.
  list(APPEND lib_targets usbadapter_platform_host)
  set_target_properties(usbadapter_platform_host PROPERTIES EXPORT_NAME platform_host)
  set_target_properties(usbadapter PROPERTIES INSTALL_RPATH "$ORIGIN")
endif()
# The namelink is part of the runtime: Java loads libusbadapter.so by that name.
install(TARGETS ${lib_targets} EXPORT usbadapterTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
  INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(DIRECTORY ${PROJECT_SOURCE_DIR}/include/usbadapter DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}
  FILES_MATCHING PATTERN "*.h")

if(TARGET usbadapter_java)
  install_jar(usbadapter_java DESTINATION ${USBADAPTER_JAR_DIR})
  get_target_property(_jar usbadapter_java JAR_FILE)
  get_filename_component(USBADAPTER_JAR_NAME "${_jar}" NAME)
endif()
if(NOT CMAKE_CROSSCOMPILING)
  # PC-side tools; the controller's package carries none.
  install(TARGETS usbadapter-shell usbadapter-fw RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
endif()

install(EXPORT usbadapterTargets NAMESPACE usbadapter:: DESTINATION ${USBADAPTER_CMAKE_DIR})
configure_package_config_file(${CMAKE_CURRENT_LIST_DIR}/usbadapterConfig.cmake.in
  ${CMAKE_CURRENT_BINARY_DIR}/usbadapterConfig.cmake
  INSTALL_DESTINATION ${USBADAPTER_CMAKE_DIR}
  PATH_VARS USBADAPTER_JAR_DIR)
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/usbadapterConfigVersion.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/usbadapterConfig.cmake
  ${CMAKE_CURRENT_BINARY_DIR}/usbadapterConfigVersion.cmake DESTINATION ${USBADAPTER_CMAKE_DIR})

# ---- Debian package: one package with everything above, for the target's
# architecture (the toolchain's multiarch triplet when cross-building).
set(_deb_arch_of_arm-linux-gnueabihf armhf)
set(_deb_arch_of_aarch64-linux-gnu arm64)
set(_deb_arch_of_x86_64-linux-gnu amd64)
set(_deb_arch_of_i386-linux-gnu i386)
set(USBADAPTER_DEB_ARCH "${_deb_arch_of_${CMAKE_LIBRARY_ARCHITECTURE}}" CACHE STRING
  "Debian architecture of the package (empty: the toolchain's, else dpkg's)")
if(NOT USBADAPTER_DEB_ARCH AND NOT CMAKE_CROSSCOMPILING)
  execute_process(COMMAND dpkg --print-architecture OUTPUT_VARIABLE USBADAPTER_DEB_ARCH
    OUTPUT_STRIP_TRAILING_WHITESPACE ERROR_QUIET)
endif()
if(NOT USBADAPTER_DEB_ARCH AND CMAKE_CROSSCOMPILING)
  message(WARNING "No Debian architecture for '${CMAKE_LIBRARY_ARCHITECTURE}': set USBADAPTER_DEB_ARCH for cpack -G DEB")
endif()

set(CPACK_PACKAGE_NAME usbadapter)
set(CPACK_PACKAGE_VENDOR "usbadapter")
set(CPACK_PACKAGE_CONTACT "usbadapter maintainers" CACHE STRING "Maintainer field of the Debian package")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "Native half of the printer's USB adapter service (JNI library)")
set(CPACK_PACKAGE_VERSION ${PROJECT_VERSION})
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_ARCHITECTURE ${USBADAPTER_DEB_ARCH})
set(CPACK_DEBIAN_PACKAGE_SECTION libs)
set(CPACK_DEBIAN_PACKAGE_DEPENDS "libc6, libstdc++6")
# shlibs file and the ldconfig trigger for the library.
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_GENERATOR DEB)
include(CPack)
