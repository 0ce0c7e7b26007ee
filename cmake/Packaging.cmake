# What an integrator gets: install rules, a CMake package (find_package
# (Alertmod)) and a pkg-config file that lead a host's build to the host
# records header and to the installed module, and the Debian package that
# CPack builds from the same rules (cpack -G DEB in the build tree).
include(GNUInstallDirs)
include(CMakePackageConfigHelpers)

# The module is a plug-in that hosts load by file name, not a library to link
# against, so it lives in a folder of its own under the multiarch directory
# whatever the prefix (GNUInstallDirs uses the multiarch name for /usr only).
if(CMAKE_LIBRARY_ARCHITECTURE)
  set(ALERTMOD_LIBDIR lib/${CMAKE_LIBRARY_ARCHITECTURE})
else()
  set(ALERTMOD_LIBDIR ${CMAKE_INSTALL_LIBDIR})
endif()
set(ALERTMOD_MODULE_DIR ${ALERTMOD_LIBDIR}/alertmod)
# Hosts open the soname's file, so that a module with other records (another
# major version) installed beside it is never picked up by mistake.
set(ALERTMOD_MODULE_FILE libalertmod.so.${PROJECT_VERSION_MAJOR})
set(ALERTMOD_DOC_DIR ${CMAKE_INSTALL_DATAROOTDIR}/doc/alertmod)

# Shared objects are not programs: no executable bit (Debian policy).
install(TARGETS alertmod LIBRARY DESTINATION ${ALERTMOD_MODULE_DIR}
        PERMISSIONS OWNER_READ OWNER_WRITE GROUP_READ WORLD_READ)
install(TARGETS alertmod-host RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
install(FILES alertmod/host_records.h DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/alertmod)
install(FILES README.md packaging/debian/copyright DESTINATION ${ALERTMOD_DOC_DIR})
install(FILES scenarios/README.md scenarios/demo.scn DESTINATION ${ALERTMOD_DOC_DIR}/scenarios)
install(DIRECTORY examples/minimal-host DESTINATION ${ALERTMOD_DOC_DIR}/examples)
# An installed alertmod-host finds the installed module (see DefaultModulePath).
target_compile_definitions(alertmod_host_cli PRIVATE
  ALERTMOD_INSTALLED_MODULE="../${ALERTMOD_MODULE_DIR}/${ALERTMOD_MODULE_FILE}")

# The CMake package finds its prefix from its own place, so a staged or moved
# installation works as well.
set(config_dir ${ALERTMOD_LIBDIR}/cmake/Alertmod)
configure_package_config_file(cmake/AlertmodConfig.cmake.in
  ${CMAKE_CURRENT_BINARY_DIR}/AlertmodConfig.cmake
  INSTALL_DESTINATION ${config_dir}
  PATH_VARS CMAKE_INSTALL_INCLUDEDIR ALERTMOD_MODULE_DIR)
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/AlertmodConfigVersion.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/AlertmodConfig.cmake
              ${CMAKE_CURRENT_BINARY_DIR}/AlertmodConfigVersion.cmake
        DESTINATION ${config_dir})

# A pkg-config file names its prefix, which is known only when installing
# (cmake --install --prefix, CPack): the prefix is filled in then.
set(ALERTMOD_PC_PREFIX "@ALERTMOD_PC_PREFIX@")
configure_file(cmake/alertmod.pc.in ${CMAKE_CURRENT_BINARY_DIR}/alertmod.pc.in @ONLY)
install(CODE "
  set(ALERTMOD_PC_PREFIX \"\${CMAKE_INSTALL_PREFIX}\")
  configure_file(\"${CMAKE_CURRENT_BINARY_DIR}/alertmod.pc.in\"
                 \"${CMAKE_CURRENT_BINARY_DIR}/alertmod.pc\" @ONLY)")
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/alertmod.pc DESTINATION ${ALERTMOD_LIBDIR}/pkgconfig)

# Debian wants the changelog and manual pages compressed, without a time
# stamp. The package is native (its version has no Debian revision), so its
# changelog is changelog.gz.
function(alertmod_gzip file)
  execute_process(COMMAND gzip -9 -n -f -k ${file} RESULT_VARIABLE result)
  if(NOT result EQUAL 0)
    message(FATAL_ERROR "gzip could not compress ${file}")
  endif()
endfunction()
set(changelog ${CMAKE_CURRENT_BINARY_DIR}/debian/changelog)
configure_file(packaging/debian/changelog.in ${changelog} @ONLY)
alertmod_gzip(${changelog})
install(FILES ${changelog}.gz DESTINATION ${ALERTMOD_DOC_DIR})
set(manual ${CMAKE_CURRENT_BINARY_DIR}/debian/alertmod-host.1)
configure_file(packaging/debian/alertmod-host.1 ${manual} COPYONLY)
alertmod_gzip(${manual})
install(FILES ${manual}.gz DESTINATION ${CMAKE_INSTALL_MANDIR}/man1)

# The FFmpeg libraries the module loads at run time, by the major versions it
# was built against: recommended, since the module mails without video too.
pkg_check_modules(ALERTMOD_AV QUIET libavcodec libavformat libavutil libavfilter libswresample)
set(av_recommends "")
foreach(library avcodec avformat avutil avfilter swresample)
  string(REGEX MATCH "^[0-9]+" major "${ALERTMOD_AV_lib${library}_VERSION}")
  if(major)
    list(APPEND av_recommends lib${library}${major})
  endif()
endforeach()
string(REPLACE ";" ", " av_recommends "${av_recommends}")

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME alertmod)
set(CPACK_PACKAGE_VENDOR "The Alertmod developers")
set(CPACK_PACKAGE_CONTACT "The Alertmod developers <alertmod@example.org>")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "e-mail notification module for a video recording server")
set(CPACK_DEBIAN_PACKAGE_DESCRIPTION
  "Alertmod is a plug-in that a video-surveillance recording server loads\n\
to mail its alarms: messages from templates, with a link into the web\n\
front end and a still or a clip of the video around the event, delivered\n\
through curl with a retry queue on disk. The package holds the module, the\n\
header of its host interface, the reference host alertmod-host, and a\n\
CMake package and pkg-config file for hosts that load the module.")
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION video)
set(CPACK_DEBIAN_PACKAGE_PRIORITY optional)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_DEPENDS "curl")
set(CPACK_DEBIAN_PACKAGE_RECOMMENDS "${av_recommends}")
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION ON)
set(CPACK_STRIP_FILES ON)
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
include(CPack)
