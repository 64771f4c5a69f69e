# Where `cmake --install` puts things, and the Debian packages of them, a component each. Program, libraries and plug-in find each
# other by paths relative to themselves, so the tree may be moved. To be included when all targets are there.

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
set_target_properties(libcalmframe PROPERTIES INSTALL_RPATH "$ORIGIN/calmframe")
# Whoever takes the sources into a build of their own installs what is theirs.
if(NOT PROJECT_IS_TOP_LEVEL)
  return()
endif()

set(CMAKE_INSTALL_DEFAULT_COMPONENT_NAME program)
install(TARGETS calmframe DESTINATION "${CMAKE_INSTALL_BINDIR}")
install(TARGETS calmframe_plugin tessel tesselui DESTINATION "${private_libdir}" COMPONENT library)
install(TARGETS libcalmframe
  LIBRARY DESTINATION "${CMAKE_INSTALL_LIBDIR}" COMPONENT library NAMELINK_COMPONENT development)

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

# For programs with frames of their own.
install(FILES library/calmframe.h library/calmframe.hpp DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}" COMPONENT development)
set(config_dir "${CMAKE_INSTALL_LIBDIR}/cmake/Calmframe")
file(RELATIVE_PATH prefix_from_config "${CMAKE_INSTALL_PREFIX}/${config_dir}" "${CMAKE_INSTALL_PREFIX}")
# Written by hand: what CMake exports takes along each library that this one is linked with, which are nobody's business.
configure_file(cmake/package/CalmframeConfig.cmake.in CalmframeConfig.cmake @ONLY)
include(CMakePackageConfigHelpers)
write_basic_package_version_file("${PROJECT_BINARY_DIR}/CalmframeConfigVersion.cmake" COMPATIBILITY SameMinorVersion)
install(FILES "${PROJECT_BINARY_DIR}/CalmframeConfig.cmake" "${PROJECT_BINARY_DIR}/CalmframeConfigVersion.cmake" DESTINATION "${config_dir}" COMPONENT development)
if(TARGET calmframe_python)
  set(python_dir lib/python3/dist-packages)  # Debian's, of all versions
  if(NOT EXISTS /etc/debian_version)
    file(RELATIVE_PATH python_dir "${CALMFRAME_PYTHON_PREFIX}" "${CALMFRAME_PYTHON_SITE}")
  endif()
  set(CALMFRAME_PYTHON_DIR "${python_dir}" CACHE PATH "Where the Python module goes")
  file(RELATIVE_PATH lib_from_module "${CMAKE_INSTALL_PREFIX}/${CALMFRAME_PYTHON_DIR}/calmframe" "${CMAKE_INSTALL_FULL_LIBDIR}")
  set_target_properties(calmframe_python PROPERTIES INSTALL_RPATH "$ORIGIN/${lib_from_module}")
  install(TARGETS calmframe_python DESTINATION "${CALMFRAME_PYTHON_DIR}/calmframe" COMPONENT python)
  install(FILES python/calmframe/__init__.py python/calmframe/py.typed DESTINATION "${CALMFRAME_PYTHON_DIR}/calmframe" COMPONENT python)
endif()

# Where MLT looks: its folders are relative to the places of Debian's libraries and data.
if(TARGET mltcalmframe)
  set_target_properties(mltcalmframe PROPERTIES INSTALL_RPATH "$ORIGIN/..")
  install(TARGETS mltcalmframe DESTINATION "${CMAKE_INSTALL_LIBDIR}/mlt-7" COMPONENT mlt)
  install(FILES editors/mlt/filter_calmframe.yml DESTINATION "${CMAKE_INSTALL_DATADIR}/mlt-7/calmframe" COMPONENT mlt)
  # Where the editors above it look.
  install(FILES editors/kdenlive/calmframe.xml DESTINATION "${CMAKE_INSTALL_DATADIR}/kdenlive/effects" COMPONENT mlt)
  install(DIRECTORY editors/shotcut/calmframe DESTINATION "${CMAKE_INSTALL_DATADIR}/shotcut/qml/filters" COMPONENT mlt)
endif()

# For hosts of their own.
install(DIRECTORY platform/hx DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}/calmframe/platform" COMPONENT development FILES_MATCHING PATTERN "*.h")
install(FILES platform/tessel/shutdown.h DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}/calmframe/platform/tessel" COMPONENT development)
file(RELATIVE_PATH prefix_from_pkgconfig "${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig" "${CMAKE_INSTALL_PREFIX}")
string(REGEX REPLACE "/$" "" prefix_from_pkgconfig "${prefix_from_pkgconfig}")
foreach(name calmframe libcalmframe)
  configure_file(cmake/package/${name}.pc.in ${name}.pc @ONLY)
  install(FILES "${PROJECT_BINARY_DIR}/${name}.pc" DESTINATION "${CMAKE_INSTALL_LIBDIR}/pkgconfig" COMPONENT development)
endforeach()

install(FILES README.md CHANGELOG.md LICENSE cmake/package/copyright DESTINATION "${CMAKE_INSTALL_DOCDIR}")
install(DIRECTORY docs DESTINATION "${CMAKE_INSTALL_DOCDIR}" FILES_MATCHING PATTERN "*.md" PATTERN "*.png" PATTERN "*.svg")
set(library_package "libcalmframe${PROJECT_VERSION_MAJOR}")
set(doc_root "${CMAKE_INSTALL_DATADIR}/doc")
install(FILES examples/minimal_host.c examples/library/steady_pipe.c examples/library/steady_threads.cpp
  DESTINATION "${CMAKE_INSTALL_DOCDIR}/examples" COMPONENT development)
execute_process(COMMAND gzip -9nc "${PROJECT_SOURCE_DIR}/cmake/package/changelog" OUTPUT_FILE "${PROJECT_BINARY_DIR}/changelog.gz"
  COMMAND_ERROR_IS_FATAL ANY)
set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS cmake/package/changelog)
install(FILES "${PROJECT_BINARY_DIR}/changelog.gz" DESTINATION "${CMAKE_INSTALL_DOCDIR}")
set(components program library development)
install(FILES "${PROJECT_BINARY_DIR}/changelog.gz" cmake/package/copyright DESTINATION "${doc_root}/${library_package}" COMPONENT library)
install(FILES "${PROJECT_BINARY_DIR}/changelog.gz" cmake/package/copyright DESTINATION "${doc_root}/libcalmframe-dev" COMPONENT development)
if(TARGET calmframe_python)
  list(APPEND components python)
  install(FILES examples/library/steady.py DESTINATION "${CMAKE_INSTALL_DOCDIR}/examples" COMPONENT python)
  install(FILES "${PROJECT_BINARY_DIR}/changelog.gz" cmake/package/copyright DESTINATION "${doc_root}/python3-calmframe" COMPONENT python)
endif()
if(TARGET mltcalmframe)
  list(APPEND components mlt)
  install(FILES "${PROJECT_BINARY_DIR}/changelog.gz" cmake/package/copyright DESTINATION "${doc_root}/mlt-calmframe" COMPONENT mlt)
endif()

set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_VENDOR "Calmframe developers")
set(CPACK_PACKAGE_CONTACT "Calmframe developers <developers@calmframe.example>")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "${PROJECT_DESCRIPTION}")
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_COMPONENTS_ALL ${components})
set(same_version "(= ${PROJECT_VERSION})")
set(what_it_does "Tracks features through a clip, smooths the camera's motion, and draws every\n\
frame anew through a warp and one window.")
set(CPACK_DEBIAN_PROGRAM_PACKAGE_NAME calmframe)
set(CPACK_DEBIAN_PROGRAM_DESCRIPTION "${PROJECT_DESCRIPTION}\n${what_it_does} Sound, subtitles and time stamps\n\
stay as they were.")
set(CPACK_DEBIAN_PROGRAM_PACKAGE_DEPENDS "${library_package} ${same_version}")
set(CPACK_DEBIAN_LIBRARY_PACKAGE_NAME "${library_package}")
set(CPACK_DEBIAN_LIBRARY_PACKAGE_SECTION libs)
set(CPACK_DEBIAN_LIBRARY_DESCRIPTION "${PROJECT_DESCRIPTION}: the library\n${what_it_does}\n.\n\
For programs with frames of their own. Holds the plug-in, too.")
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_NAME libcalmframe-dev)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEVELOPMENT_DESCRIPTION "${PROJECT_DESCRIPTION}: headers\n${what_it_does}\n.\n\
Headers of the library for C and C++, and for hosts that load the plug-in\nthemselves; examples of both.")
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS "${library_package} ${same_version}")
set(CPACK_DEBIAN_PYTHON_PACKAGE_NAME python3-calmframe)
set(CPACK_DEBIAN_PYTHON_PACKAGE_SECTION python)
set(CPACK_DEBIAN_PYTHON_DESCRIPTION "${PROJECT_DESCRIPTION}: the Python module\n${what_it_does}\n.\n\
Frames are numpy arrays.")
set(CPACK_DEBIAN_PYTHON_PACKAGE_DEPENDS "${library_package} ${same_version}, python3-numpy, ${CALMFRAME_PYTHON_DEPENDS}")
set(CPACK_DEBIAN_MLT_PACKAGE_NAME mlt-calmframe)
set(CPACK_DEBIAN_MLT_DESCRIPTION "${PROJECT_DESCRIPTION}: a filter for MLT\n${what_it_does}\n.\n\
For melt and editors that stand on MLT; with panels for Kdenlive and Shotcut.")
set(CPACK_DEBIAN_MLT_PACKAGE_DEPENDS "${library_package} ${same_version}")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_SECTION video)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS "${PROJECT_BINARY_DIR}/platform/tessel"
  "${PROJECT_BINARY_DIR}/platform/tesselui" "${PROJECT_BINARY_DIR}/apps/calmframe")
include(CPack)
