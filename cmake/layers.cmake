# The functions from which the build is made.

# A layer: sources, the headers that higher layers may include, and the layers it uses. Its headers are linked into a
# folder that contains nothing else. This keeps includes pointing down.
function(qz_layer name)
  cmake_parse_arguments(arg "" "ROOT" "HEADERS;SOURCES;USES" ${ARGN})
  set(root ${PROJECT_SOURCE_DIR}/${arg_ROOT})
  set(links ${PROJECT_BINARY_DIR}/layers/${name})
  foreach(header IN LISTS arg_HEADERS)
    cmake_path(GET header PARENT_PATH folder)
    file(MAKE_DIRECTORY ${links}/${folder})
    file(CREATE_LINK ${root}/${header} ${links}/${header} SYMBOLIC)
  endforeach()
  set(scope INTERFACE)
  if(arg_SOURCES)
    set(scope PUBLIC)
    list(TRANSFORM arg_SOURCES PREPEND ${root}/)
    add_library(${name} STATIC ${arg_SOURCES})
    # The libraries need only libc, so nothing may require the C++ runtime.
    target_compile_options(${name} PRIVATE -fno-exceptions -fno-rtti -fno-threadsafe-statics -fvisibility=hidden)
  else()
    add_library(${name} INTERFACE)
  endif()
  target_include_directories(${name} ${scope} ${links})
  target_link_libraries(${name} ${scope} ${arg_USES})
endfunction()

# A shared library made of whole layers. It is linked as C, because it may need only libc, and exports only the names in
# its map. REQUIRES lists the project's libraries whose headers and symbols its users need, too.
function(qz_shared_library name)
  cmake_parse_arguments(arg "" "MAP;DESCRIPTION" "LAYERS;HEADERS;REQUIRES" ${ARGN})
  list(TRANSFORM arg_LAYERS REPLACE "(.+)" "$<TARGET_OBJECTS:\\1>" OUTPUT_VARIABLE objects)
  add_library(${name} SHARED ${objects})
  set_target_properties(${name} PROPERTIES
    LINKER_LANGUAGE C
    VERSION ${PROJECT_VERSION}
    SOVERSION ${PROJECT_VERSION_MAJOR}
    LINK_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/${arg_MAP})
  if(arg_REQUIRES)
    set_target_properties(${name} PROPERTIES INSTALL_RPATH $ORIGIN)
  endif()
  # Never unloaded: when a thread ends, it runs code of these libraries to free its records, and every fork takes their
  # locks.
  target_link_options(${name} PRIVATE
    -Wl,--version-script=${CMAKE_CURRENT_SOURCE_DIR}/${arg_MAP} -Wl,-z,nodelete)
  if(NOT QZ_SANITIZE)
    target_link_options(${name} PRIVATE -Wl,-z,defs -Wl,--as-needed)
  endif()
  target_link_libraries(${name} PRIVATE Threads::Threads PUBLIC ${arg_REQUIRES})
  target_include_directories(${name} INTERFACE
    $<BUILD_INTERFACE:${PROJECT_BINARY_DIR}/layers/layer_interface>
    $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>)
  list(JOIN arg_REQUIRES " " requires)
  qz_install_library(${name} "${arg_HEADERS}" "${requires}" "${arg_DESCRIPTION}")
endfunction()

# Installs a library and its pkg-config and CMake packages. `requires` is separated by blanks, as both packages expect.
function(qz_install_library name headers requires description)
  set(package_dir ${CMAKE_INSTALL_LIBDIR}/cmake/${name})
  # Relative, so that an installed tree can be moved, unless the libraries are installed to an absolute path.
  if(IS_ABSOLUTE ${CMAKE_INSTALL_LIBDIR})
    set(pc_prefix ${CMAKE_INSTALL_PREFIX})
  else()
    file(RELATIVE_PATH pc_prefix /${CMAKE_INSTALL_LIBDIR}/pkgconfig /)
    string(REGEX REPLACE "(.*)/$" "\${pcfiledir}/\\1" pc_prefix "${pc_prefix}")
  endif()
  cmake_path(APPEND pc_includedir "\${prefix}" ${CMAKE_INSTALL_INCLUDEDIR})
  cmake_path(APPEND pc_libdir "\${prefix}" ${CMAKE_INSTALL_LIBDIR})
  install(TARGETS ${name} EXPORT ${name}-targets
    LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT library NAMELINK_COMPONENT development)
  list(TRANSFORM headers PREPEND ${PROJECT_SOURCE_DIR}/include/qz/)
  install(FILES ${headers} DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/qz COMPONENT development)
  install(EXPORT ${name}-targets NAMESPACE ${name}:: DESTINATION ${package_dir} COMPONENT development)

  include(CMakePackageConfigHelpers)
  set(made ${PROJECT_BINARY_DIR}/packages)
  configure_file(${PROJECT_SOURCE_DIR}/cmake/library.pc.in ${made}/${name}.pc @ONLY)
  configure_package_config_file(${PROJECT_SOURCE_DIR}/cmake/library-config.cmake.in ${made}/${name}-config.cmake
    INSTALL_DESTINATION ${package_dir})
  write_basic_package_version_file(${made}/${name}-config-version.cmake COMPATIBILITY SameMajorVersion)
  install(FILES ${made}/${name}.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT development)
  install(FILES ${made}/${name}-config.cmake ${made}/${name}-config-version.cmake DESTINATION ${package_dir}
    COMPONENT development)
endfunction()

# A program that is not installed and finds the libraries in the build tree. It USES layers or libraries and is put into
# FOLDER of the build tree.
function(qz_program name)
  cmake_parse_arguments(arg "" "FOLDER" "SOURCES;USES" ${ARGN})
  add_executable(${name} ${arg_SOURCES})
  target_link_libraries(${name} PRIVATE ${arg_USES})
  set_target_properties(${name} PROPERTIES
    INSTALL_RPATH ${PROJECT_BINARY_DIR}/lib
    RUNTIME_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/${arg_FOLDER})
endfunction()
