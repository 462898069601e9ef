add_compile_options(-Wall -Wextra -Wshadow -Werror)
# A program carries none but the libraries that it uses (THIRD-PARTY.md).
add_link_options(-Wl,--as-needed)
# Sources are compiled eight at a time: most of a source's time goes into the headers that they share. So a name that
# a source keeps for itself is one in its folder. The build for ThreadSanitizer (CMakePresets.json) compiles each alone,
# which shows what a source forgot to include.
option(QV_UNITY "compile several sources of a target at a time" ON)
set(CMAKE_UNITY_BUILD ${QV_UNITY})
set(CMAKE_UNITY_BUILD_BATCH_SIZE 8)
if(QV_UNITY)
  add_compile_options($<$<COMPILE_LANGUAGE:CXX>:-Wno-subobject-linkage>)  # a unit of several sources is a header to GCC
endif()
if(QV_SANITIZE STREQUAL "address")
  add_compile_options(-fsanitize=address,undefined -fno-sanitize-recover=all -fno-omit-frame-pointer)
  add_link_options(-fsanitize=address,undefined)
elseif(QV_SANITIZE STREQUAL "thread")
  add_compile_options(-fsanitize=thread -fno-omit-frame-pointer)
  add_link_options(-fsanitize=thread)
elseif(NOT QV_SANITIZE STREQUAL "")
  message(FATAL_ERROR "QV_SANITIZE is address, thread or nothing")
endif()

# qv_library(name SOURCES a.cpp ... [DEPS libraries ...] [PACKAGES pkg-config modules ...])
# One static library for one folder. Headers are included by their path from the project's root.
function(qv_library name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPS;PACKAGES" ${ARGN})
  add_library(${name} STATIC ${ARG_SOURCES})
  target_include_directories(${name} PUBLIC ${PROJECT_SOURCE_DIR})
  target_link_libraries(${name} PUBLIC ${ARG_DEPS} Threads::Threads)
  if(ARG_PACKAGES)
    pkg_check_modules(${name}_packages REQUIRED IMPORTED_TARGET ${ARG_PACKAGES})
    target_link_libraries(${name} PRIVATE PkgConfig::${name}_packages)
  endif()
endfunction()

# qv_module(name SOURCES a.cpp ... [DEPS libraries ...] [PACKAGES pkg-config modules ...])
# A module that the daemon loads when it needs it (platform/LateModule.h). Only its entry is to be seen, and it
# carries none but the libraries that it uses.
function(qv_module name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPS;PACKAGES" ${ARGN})
  add_library(${name} MODULE ${ARG_SOURCES})
  set_target_properties(${name} PROPERTIES PREFIX "" CXX_VISIBILITY_PRESET hidden
                        LIBRARY_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/lib/quorveld INSTALL_RPATH "$ORIGIN")
  get_property(abi GLOBAL PROPERTY QV_MODULE_ABI)
  target_compile_definitions(${name} PRIVATE QV_MODULE_ABI="${abi}")
  target_link_libraries(${name} PRIVATE ${ARG_DEPS})
  if(ARG_PACKAGES)
    pkg_check_modules(${name}_packages REQUIRED IMPORTED_TARGET ${ARG_PACKAGES})
    target_link_libraries(${name} PRIVATE PkgConfig::${name}_packages)
  endif()
  target_link_options(${name} PRIVATE -Wl,--exclude-libs,ALL)
  install(TARGETS ${name} LIBRARY DESTINATION lib/quorveld)
endfunction()

# qv_sdk_library(name LIBRARY static-library ENTRY source ... PC template PACKAGE Name HEADERS header ...)
# The shared library that others link (with pkg-config, or as Quorvel::name of the CMake package Name), and name_static,
# the same in a form for tests, which sanitizers see through.
# Nothing but the public names leaves it, and it stays loaded: its threads live as long as the process.
function(qv_sdk_library name)
  cmake_parse_arguments(ARG "" "LIBRARY;PC;PACKAGE" "ENTRY;HEADERS" ${ARGN})
  include(GNUInstallDirs)
  include(CMakePackageConfigHelpers)
  set(map ${PROJECT_SOURCE_DIR}/sdk/common/quorvel.map)
  add_library(${name} SHARED ${ARG_ENTRY})
  set_target_properties(${name} PROPERTIES QV_OWN_PLATFORM ON)
  target_link_libraries(${name} PRIVATE ${ARG_LIBRARY} qv_sdbus)
  target_include_directories(${name} INTERFACE $<BUILD_INTERFACE:${CMAKE_CURRENT_SOURCE_DIR}>
                             $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}/sdk/common>)
  target_compile_features(${name} INTERFACE cxx_std_20)
  target_link_options(${name} PRIVATE -Wl,--whole-archive $<TARGET_FILE:${ARG_LIBRARY}> -Wl,--no-whole-archive
                      -Wl,--version-script=${map} -Wl,-z,nodelete)
  set_target_properties(${name} PROPERTIES VERSION ${PROJECT_VERSION} SOVERSION ${PROJECT_VERSION_MAJOR}
                        CXX_VISIBILITY_PRESET hidden VISIBILITY_INLINES_HIDDEN ON LINK_DEPENDS ${map})
  # Relative to the file itself: the prefix is chosen at the installation, and an image has a root of its own.
  file(RELATIVE_PATH include_from_pc /root/${CMAKE_INSTALL_LIBDIR}/pkgconfig /root/${CMAKE_INSTALL_INCLUDEDIR})
  configure_file(${ARG_PC}.in ${ARG_PC} @ONLY)
  install(TARGETS ${name} EXPORT ${ARG_PACKAGE} LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
          INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
  set(package_folder ${CMAKE_INSTALL_LIBDIR}/cmake/${ARG_PACKAGE})
  install(EXPORT ${ARG_PACKAGE} FILE ${ARG_PACKAGE}Config.cmake NAMESPACE Quorvel:: DESTINATION ${package_folder})
  write_basic_package_version_file(${ARG_PACKAGE}ConfigVersion.cmake COMPATIBILITY SameMajorVersion)
  install(FILES ${CMAKE_CURRENT_BINARY_DIR}/${ARG_PACKAGE}ConfigVersion.cmake DESTINATION ${package_folder})
  install(FILES ${ARG_HEADERS} ${PROJECT_SOURCE_DIR}/sdk/common/quorvel/Types.h
          DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/quorvel)
  install(FILES ${CMAKE_CURRENT_BINARY_DIR}/${ARG_PC} DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)

  qv_library(${name}_static SOURCES ${ARG_ENTRY} DEPS ${ARG_LIBRARY} qv_sdbus)
endfunction()

# qv_test(name SOURCES a.cpp ... [DEPS libraries ...] [SERIAL] [TIMEOUT seconds])
# One GoogleTest program; each of its cases is a case of ctest. SERIAL for what needs the machine.
function(qv_test name)
  cmake_parse_arguments(ARG "SERIAL" "TIMEOUT" "SOURCES;DEPS;ENVIRONMENT" ${ARGN})
  find_package(GTest REQUIRED)
  include(GoogleTest)
  add_executable(${name} ${ARG_SOURCES})
  if(QV_SANITIZE STREQUAL "")
    target_compile_options(${name} PRIVATE -O1)  # compiles a tenth faster; nobody measures a test
  endif()
  target_link_libraries(${name} PRIVATE ${ARG_DEPS} GTest::gtest GTest::gtest_main)
  if(NOT ARG_TIMEOUT)
    set(ARG_TIMEOUT 120)
  endif()
  gtest_discover_tests(${name} TEST_PREFIX "${name}." DISCOVERY_MODE PRE_TEST DISCOVERY_TIMEOUT 60
                       PROPERTIES TIMEOUT ${ARG_TIMEOUT} RUN_SERIAL "${ARG_SERIAL}")
endfunction()

# qv_extension(program DIRECTORY bundle INFO Info.json SOURCES source ... [LIBRARIES library ...])
# A broadcast extension in a bundle of its own, a plug-in of the example game. Where it is built it has the extension
# library in its bundle: an extension may read its own bundle and the system's libraries, and no build directory.
function(qv_extension program)
  cmake_parse_arguments(ARG "" "DIRECTORY;INFO" "SOURCES;LIBRARIES" ${ARGN})
  add_executable(${program} ${ARG_SOURCES})
  target_link_libraries(${program} PRIVATE quorvel-extension ${ARG_LIBRARIES})
  set_target_properties(${program} PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${ARG_DIRECTORY}/bin
                        BUILD_RPATH "$ORIGIN/../lib")
  add_custom_command(TARGET ${program} POST_BUILD
    COMMAND ${CMAKE_COMMAND} -E make_directory ${ARG_DIRECTORY}/lib
    COMMAND ${CMAKE_COMMAND} -E copy $<TARGET_FILE:quorvel-extension>
            ${ARG_DIRECTORY}/lib/$<TARGET_SONAME_FILE_NAME:quorvel-extension> VERBATIM)
  configure_file(${ARG_INFO} ${ARG_DIRECTORY}/Info.json COPYONLY)
  get_filename_component(bundle ${ARG_DIRECTORY} NAME)
  qv_install_example(${program} Game.app/PlugIns/${bundle} ${ARG_INFO})
endfunction()

# qv_install_example(program bundle Info.json): as a device's application. Only where the component is asked for:
#   cmake --install build/release --prefix /usr --component examples
function(qv_install_example program bundle info)
  install(TARGETS ${program} RUNTIME DESTINATION /Applications/${bundle}/bin COMPONENT examples EXCLUDE_FROM_ALL)
  install(FILES ${info} DESTINATION /Applications/${bundle} COMPONENT examples EXCLUDE_FROM_ALL)
endfunction()
