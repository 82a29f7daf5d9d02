# Headers, libraries, pkg-config file and CMake package config.
include(CMakePackageConfigHelpers)

install(TARGETS norvo norvoplatform EXPORT norvoTargets
  LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
  PUBLIC_HEADER DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/quib
  INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(DIRECTORY ${PROJECT_SOURCE_DIR}/include/norvo DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(EXPORT norvoTargets NAMESPACE norvo:: DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/norvo)

configure_package_config_file(${PROJECT_SOURCE_DIR}/cmake/norvoConfig.cmake.in
  ${CMAKE_CURRENT_BINARY_DIR}/norvoConfig.cmake INSTALL_DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/norvo)
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/norvoConfigVersion.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/norvoConfig.cmake ${CMAKE_CURRENT_BINARY_DIR}/norvoConfigVersion.cmake
  DESTINATION ${CMAKE_INSTALL_LIBDIR}/cmake/norvo)

configure_file(${PROJECT_SOURCE_DIR}/cmake/norvo.pc.in ${CMAKE_CURRENT_BINARY_DIR}/norvo.pc @ONLY)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/norvo.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
