# SPDX-License-Identifier: Apache-2.0
# `cpack -G DEB` in the build folder makes two Debian packages from the
# install components: kvasr (runtime) and kvasr-dev. Configure with
# -DCMAKE_INSTALL_PREFIX=/usr so that the libraries go to Debian's multiarch
# folder (GNUInstallDirs chooses it for that prefix only).
set(KVASR_PACKAGE_CONTACT "kvasr developers <kvasr@example.org>" CACHE STRING
  "Maintainer named by the Debian packages")

set(CPACK_PACKAGE_NAME kvasr)
set(CPACK_PACKAGE_VERSION ${PROJECT_VERSION})
set(CPACK_PACKAGE_CONTACT ${KVASR_PACKAGE_CONTACT})
set(CPACK_STRIP_FILES ON)
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)

set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_ALL runtime dev)
set(CPACK_COMPONENT_DEV_DEPENDS runtime)
set(CPACK_DEBIAN_ENABLE_COMPONENT_DEPENDS ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_RELEASE 1)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS_POLICY ">=")
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)

set(CPACK_DEBIAN_RUNTIME_PACKAGE_NAME kvasr)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SECTION sound)
# The default decoder manifest names this package's acoustic model,
# dictionary and language model.
set(CPACK_DEBIAN_RUNTIME_PACKAGE_DEPENDS pocketsphinx-en-us)
# `kvasr vad --plot` runs gnuplot; the Python module takes NumPy arrays.
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SUGGESTS "gnuplot-nox, python3, python3-numpy")
# The loader cache is refreshed by dpkg's trigger rather than by scripts.
set(CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA ${CMAKE_CURRENT_LIST_DIR}/debian/triggers)
# The first line of each description is the package synopsis.
set(CPACK_DEBIAN_RUNTIME_DESCRIPTION "offline speech recognition library and tool
libkvasr_offline turns 16 kHz speech into text on the machine itself, through
nine C functions; the kvasr tool transcribes audio files and microphone
streams. Includes the default voice activity, decoder and punctuation models
and the Python module kvasr.")

set(CPACK_DEBIAN_DEV_PACKAGE_NAME kvasr-dev)
set(CPACK_DEBIAN_DEV_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEV_DESCRIPTION "offline speech recognition library - development files
Headers of libkvasr_offline and of the decoder and punctuation library
interfaces, the CMake package (find_package(kvasr), target kvasr::offline)
and the pkg-config file kvasr.pc.")

# Every Debian package carries its copyright file and a changelog.
set(KVASR_DEBIAN_VERSION ${PROJECT_VERSION}-${CPACK_DEBIAN_PACKAGE_RELEASE})
string(TIMESTAMP KVASR_PACKAGE_DATE "%a, %d %b %Y %H:%M:%S +0000" UTC)
configure_file(${CMAKE_CURRENT_LIST_DIR}/debian/changelog.in ${PROJECT_BINARY_DIR}/changelog.Debian
  @ONLY)
execute_process(COMMAND gzip -n -9 -c ${PROJECT_BINARY_DIR}/changelog.Debian
  OUTPUT_FILE ${PROJECT_BINARY_DIR}/changelog.Debian.gz COMMAND_ERROR_IS_FATAL ANY)
foreach(component runtime dev)
  string(TOUPPER ${component} COMPONENT)
  install(FILES ${CMAKE_CURRENT_LIST_DIR}/debian/copyright ${PROJECT_BINARY_DIR}/changelog.Debian.gz
    DESTINATION ${CMAKE_INSTALL_DATAROOTDIR}/doc/${CPACK_DEBIAN_${COMPONENT}_PACKAGE_NAME}
    COMPONENT ${component})
endforeach()

include(CPack)
