# SPDX-License-Identifier: Apache-2.0
# What `cmake --install` and cpack put where. Two components: `runtime` (the
# libraries, the tool, the default models, the Python module) and `dev` (the
# headers, the CMake package and the pkg-config file).
include(CMakePackageConfigHelpers)

set(KVASR_INSTALL_CMAKEDIR ${CMAKE_INSTALL_LIBDIR}/cmake/kvasr)

install(DIRECTORY ${PROJECT_SOURCE_DIR}/models/ DESTINATION ${KVASR_INSTALL_MODELSDIR}
  COMPONENT runtime)
# The platform headers are for whoever builds a replacement decoder or
# punctuation library.
install(FILES
  ${PROJECT_SOURCE_DIR}/include/kvasr_offline.h
  ${PROJECT_SOURCE_DIR}/include/kvasr_decoder_api.h
  ${PROJECT_SOURCE_DIR}/include/kvasr_punctuator_api.h
  DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} COMPONENT dev)

# The CMake package describes libkvasr_offline with the libraries it links;
# a build that puts other targets behind it (the sanitizer and fuzzing builds
# link the test doubles) has none to install.
set(package_exportable ON)
foreach(provider ${KVASR_DECODER_LIBRARY} ${KVASR_PUNCTUATOR_LIBRARY})
  if(TARGET ${provider} AND NOT provider MATCHES "^kvasr_(decoder|punctuator)$")
    set(package_exportable OFF)
  endif()
endforeach()
if(package_exportable)
  install(EXPORT kvasrTargets NAMESPACE kvasr:: DESTINATION ${KVASR_INSTALL_CMAKEDIR}
    COMPONENT dev)
  configure_package_config_file(${CMAKE_CURRENT_LIST_DIR}/kvasrConfig.cmake.in
    ${PROJECT_BINARY_DIR}/kvasrConfig.cmake
    INSTALL_DESTINATION ${KVASR_INSTALL_CMAKEDIR}
    PATH_VARS KVASR_INSTALL_MODELSDIR)
  # Before 1.0 a minor version may change the interface.
  write_basic_package_version_file(${PROJECT_BINARY_DIR}/kvasrConfigVersion.cmake
    COMPATIBILITY SameMinorVersion)
  install(FILES ${PROJECT_BINARY_DIR}/kvasrConfig.cmake ${PROJECT_BINARY_DIR}/kvasrConfigVersion.cmake
    DESTINATION ${KVASR_INSTALL_CMAKEDIR} COMPONENT dev)
endif()

# The .pc file locates the prefix from its own folder, so a moved prefix works.
file(RELATIVE_PATH KVASR_PKGCONFIG_TO_PREFIX ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig
  ${CMAKE_INSTALL_PREFIX})
string(REGEX REPLACE "/$" "" KVASR_PKGCONFIG_TO_PREFIX ${KVASR_PKGCONFIG_TO_PREFIX})
configure_file(${CMAKE_CURRENT_LIST_DIR}/kvasr.pc.in ${PROJECT_BINARY_DIR}/kvasr.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/kvasr.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig
  COMPONENT dev)

# The Python module goes where Debian's python3 looks, with a _paths.py that
# tells it where the library and the models are.
set(KVASR_INSTALL_PYTHONDIR lib/python3/dist-packages CACHE STRING
  "Where the Python module is installed, relative to the prefix")
install(DIRECTORY ${PROJECT_SOURCE_DIR}/python/kvasr DESTINATION ${KVASR_INSTALL_PYTHONDIR}
  COMPONENT runtime PATTERN __pycache__ EXCLUDE PATTERN _paths.py EXCLUDE)
set(python_dir ${CMAKE_INSTALL_PREFIX}/${KVASR_INSTALL_PYTHONDIR}/kvasr)
file(RELATIVE_PATH KVASR_PYTHONDIR_TO_LIBRARY ${python_dir}
  ${CMAKE_INSTALL_FULL_LIBDIR}/libkvasr_offline)
file(RELATIVE_PATH KVASR_PYTHONDIR_TO_MODELSDIR ${python_dir}
  ${CMAKE_INSTALL_PREFIX}/${KVASR_INSTALL_MODELSDIR})
configure_file(${CMAKE_CURRENT_LIST_DIR}/python_paths.py.in ${PROJECT_BINARY_DIR}/_paths.py @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/_paths.py DESTINATION ${KVASR_INSTALL_PYTHONDIR}/kvasr
  COMPONENT runtime)
