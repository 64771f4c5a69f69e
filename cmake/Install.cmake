# Where `cmake --install` puts things, and the Debian package of them. Program, libraries and plug-in find each other by
# paths relative to themselves, so the tree may be moved. To be included when all targets are there.

# Where Debian looks: the plug-in is of one architecture, and pkg-config asks by that.
if(CMAKE_LIBRARY_ARCHITECTURE AND EXISTS /etc/debian_version)
  set(CMAKE_INSTALL_LIBDIR "lib/${CMAKE_LIBRARY_ARCHITECTURE}" CACHE PATH "Where libraries go")
endif()
include(GNUInstallDirs)
set(private_libdir "${CMAKE_INSTALL_LIBDIR}/calmframe")
file(RELATIVE_PATH private_from_bin "${CMAKE_INSTALL_FULL_BINDIR}" "${CMAKE_INSTALL_FULL_LIBDIR}/calmframe")

target_compile_definitions(calmframe PRIVATE CALMFRAME_INSTALLED_PLUGIN_DIR="${private_from_bin}")
set_target_properties(calmframe PROPERTIES INSTALL_RPATH "$ORIGIN/${private_from_bin}")
set_target_properties(calmframe_plugin tessel tesselui PROPERTIES INSTALL_RPATH "$ORIGIN")
install(TARGETS calmframe DESTINATION "${CMAKE_INSTALL_BINDIR}")
install(TARGETS calmframe_plugin tessel tesselui DESTINATION "${private_libdir}")

# What the program says of itself.
set(manual "${PROJECT_BINARY_DIR}/manual")
add_custom_command(
  OUTPUT "${manual}/calmframe.1.gz" "${manual}/calmframe" "${manual}/_calmframe" "${manual}/calmframe.fish"
  COMMAND "${CMAKE_COMMAND}" -E make_directory "${manual}"
  COMMAND calmframe write-man-page > "${manual}/calmframe.1"
  COMMAND gzip -9nf "${manual}/calmframe.1"
  COMMAND calmframe write-bash-completion > "${manual}/calmframe"
  COMMAND calmframe write-zsh-completion > "${manual}/_calmframe"
  COMMAND calmframe write-fish-completion > "${manual}/calmframe.fish"
  DEPENDS calmframe
  VERBATIM)
add_custom_target(calmframe_manual ALL DEPENDS "${manual}/calmframe.1.gz")
install(FILES "${manual}/calmframe.1.gz" DESTINATION "${CMAKE_INSTALL_MANDIR}/man1")
install(FILES "${manual}/calmframe" DESTINATION "${CMAKE_INSTALL_DATADIR}/bash-completion/completions")
install(FILES "${manual}/_calmframe" DESTINATION "${CMAKE_INSTALL_DATADIR}/zsh/vendor-completions")
install(FILES "${manual}/calmframe.fish" DESTINATION "${CMAKE_INSTALL_DATADIR}/fish/vendor_completions.d")

# For hosts of their own.
install(DIRECTORY platform/hx DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}/calmframe/platform" FILES_MATCHING PATTERN "*.h")
install(FILES platform/tessel/shutdown.h DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}/calmframe/platform/tessel")
file(RELATIVE_PATH prefix_from_pkgconfig "${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig" "${CMAKE_INSTALL_PREFIX}")
string(REGEX REPLACE "/$" "" prefix_from_pkgconfig "${prefix_from_pkgconfig}")
configure_file(cmake/package/calmframe.pc.in calmframe.pc @ONLY)
install(FILES "${PROJECT_BINARY_DIR}/calmframe.pc" DESTINATION "${CMAKE_INSTALL_LIBDIR}/pkgconfig")

install(FILES README.md CHANGELOG.md LICENSE cmake/package/copyright DESTINATION "${CMAKE_INSTALL_DOCDIR}")
install(DIRECTORY docs DESTINATION "${CMAKE_INSTALL_DOCDIR}" FILES_MATCHING PATTERN "*.md" PATTERN "*.png" PATTERN "*.svg")
install(FILES examples/minimal_host.c DESTINATION "${CMAKE_INSTALL_DOCDIR}/examples")
execute_process(COMMAND gzip -9nc "${PROJECT_SOURCE_DIR}/cmake/package/changelog" OUTPUT_FILE "${PROJECT_BINARY_DIR}/changelog.gz"
  COMMAND_ERROR_IS_FATAL ANY)
set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS cmake/package/changelog)
install(FILES "${PROJECT_BINARY_DIR}/changelog.gz" DESTINATION "${CMAKE_INSTALL_DOCDIR}")

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_VENDOR "Calmframe developers")
set(CPACK_PACKAGE_CONTACT "Calmframe developers <developers@calmframe.example>")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "${PROJECT_DESCRIPTION}")
set(CPACK_DEBIAN_PACKAGE_DESCRIPTION
  "Tracks features through a clip, smooths the camera's motion, and draws every\n\
frame anew through a warp and one crop window. Sound, subtitles and time stamps\n\
stay as they were.\n\
.\n\
Holds the program, the plug-in on which it stands, and the headers for hosts\n\
that load the plug-in themselves.")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION video)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS "${PROJECT_BINARY_DIR}/platform/tessel" "${PROJECT_BINARY_DIR}/platform/tesselui")
include(CPack)
