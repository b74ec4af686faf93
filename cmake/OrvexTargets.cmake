# Target helpers. Every source, test, benchmark and program is found by glob
# (re-globbed at build time), so a file that exists is a file that is built:
# no test can be silently dropped from the build.

set(ORVEX_SUBSYSTEMS "" CACHE INTERNAL "")
set(ORVEX_PROGRAMS "" CACHE INTERNAL "")
set(ORVEX_STATIC_LIBS "" CACHE INTERNAL "")

# A static internal library from every .cc of DIR. A directory without sources
# is an error rather than an empty placeholder: a placeholder would satisfy
# every target that names it while building nothing, hiding a subsystem that
# was declared but never written. WORKER_ONLY keeps the library out of
# libfileindex (code that only the extraction worker may run).
function(orvex_internal_library name)
  cmake_parse_arguments(ARG "WORKER_ONLY" "DIR" "DEPS" ${ARGN})
  file(GLOB srcs CONFIGURE_DEPENDS ${PROJECT_SOURCE_DIR}/${ARG_DIR}/*.cc)
  if(NOT srcs)
    message(FATAL_ERROR
      "${name}: ${ARG_DIR}/ has no sources yet. Declare the subsystem in "
      "CMakeLists.txt when its first source lands.")
  endif()
  add_library(${name} STATIC ${srcs})
  target_link_libraries(${name} PUBLIC ${ARG_DEPS})
  target_include_directories(${name} PUBLIC
    $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}/include>
    PRIVATE ${PROJECT_SOURCE_DIR}/src)
  target_compile_definitions(${name} PRIVATE ORVEX_BUILDING_LIBRARY)
  if(NOT ARG_WORKER_ONLY)
    set(ORVEX_STATIC_LIBS "${ORVEX_STATIC_LIBS};${name}" CACHE INTERNAL "")
  endif()
endfunction()

function(orvex_subsystem sub)
  cmake_parse_arguments(ARG "" "" "DEPS" ${ARGN})
  set(layer_deps "")
  foreach(dep ${ARG_DEPS})
    if(dep MATCHES "^orvex_(.+)$" AND NOT dep STREQUAL "orvex_portable")
      list(APPEND layer_deps ${CMAKE_MATCH_1})
    endif()
  endforeach()
  orvex_layer_declare(${sub} ${layer_deps})
  orvex_internal_library(orvex_${sub} DIR src/${sub} DEPS ${ARG_DEPS})
  set(ORVEX_SUBSYSTEMS "${ORVEX_SUBSYSTEMS};${sub}" CACHE INTERNAL "")
endfunction()

# Every internal library, for tests, benchmarks and fuzzers that want it all.
function(orvex_all_internal out)
  set(libs orvex_portable)
  foreach(sub ${ORVEX_SUBSYSTEMS})
    list(APPEND libs orvex_${sub})
  endforeach()
  set(${out} ${libs} PARENT_SCOPE)
endfunction()

# libfileindex: the objects of every subsystem, exporting only ORVEX_EXPORT
# names. Built from the same objects as the internal libraries: compiled once.
function(orvex_shared_library)
  set(objects "")
  foreach(lib ${ORVEX_STATIC_LIBS})
    if(lib)
      list(APPEND objects $<TARGET_OBJECTS:${lib}>)
    endif()
  endforeach()
  add_library(fileindex SHARED ${PROJECT_SOURCE_DIR}/cmake/fileindex_version.cc ${objects})
  target_link_libraries(fileindex PUBLIC PkgConfig::JSONCPP
                        PRIVATE ICU::uc ICU::i18n Threads::Threads)
  # The generated orvex/version.h sits in the build tree until it is installed
  # beside the other headers.
  target_include_directories(fileindex PUBLIC
    $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}/include>
    $<BUILD_INTERFACE:${PROJECT_BINARY_DIR}/include>
    $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>)
  # The public headers use C++17 (std::string_view, inline variables), so a
  # program linking Orvex::fileindex is compiled as C++17 at least.
  target_compile_features(fileindex PUBLIC cxx_std_17)
  set_target_properties(fileindex PROPERTIES
    VERSION ${PROJECT_VERSION} SOVERSION ${PROJECT_VERSION_MAJOR})
  # The same name inside this build as in the installed package.
  add_library(Orvex::fileindex ALIAS fileindex)
  # Every symbol must resolve at link time, except under clang's sanitizers,
  # whose runtime only the executable brings.
  if(NOT (ORVEX_BUILD_FUZZ OR (ORVEX_SANITIZE AND CMAKE_CXX_COMPILER_ID STREQUAL "Clang")))
    target_link_options(fileindex PRIVATE -Wl,--no-undefined)
  endif()
endfunction()

# Each directory under programs/ is one program named after it. Programs use
# the internal libraries so they run from the build tree without installing.
function(orvex_programs)
  orvex_all_internal(libs)
  file(GLOB dirs LIST_DIRECTORIES true ${PROJECT_SOURCE_DIR}/programs/*)
  foreach(dir ${dirs})
    if(IS_DIRECTORY ${dir})
      get_filename_component(prog ${dir} NAME)
      file(GLOB srcs CONFIGURE_DEPENDS ${dir}/*.cc)
      if(srcs)
        add_executable(${prog} ${srcs})
        set(ORVEX_PROGRAMS "${ORVEX_PROGRAMS};${prog}" CACHE INTERNAL "")
        target_link_libraries(${prog} PRIVATE ${libs})
        target_include_directories(${prog} PRIVATE ${PROJECT_SOURCE_DIR}/src)
        if(prog STREQUAL "kalocontentextractd")
          # The one program that runs the parsers, in its worker processes.
          target_link_libraries(${prog} PRIVATE orvex_extractd orvex_extract)
        endif()
        if(prog STREQUAL "kaloelasticd")
          # The search daemon's engine: SQLite stays out of everything else.
          target_link_libraries(${prog} PRIVATE orvex_searchd)
        endif()
        if(prog STREQUAL "kalonotifyd")
          # The watcher's loop lives in its own library, which its tests share.
          target_link_libraries(${prog} PRIVATE orvex_watch)
        endif()
        if(prog STREQUAL "fileindexd")
          # The indexing daemon's loop lives in its own library, which its tests share.
          target_link_libraries(${prog} PRIVATE orvex_indexd)
        endif()
        if(prog STREQUAL "kalopmxnotify" OR prog STREQUAL "kalocontentextractd")
          # The library runs these tools from the platform's own fixed place
          # (under ORVEX_ROOT when that is set).
          install(TARGETS ${prog} RUNTIME DESTINATION /usr/kalo/bin)
        else()
          install(TARGETS ${prog} RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR})
        endif()
      endif()
    endif()
  endforeach()
endfunction()

# tests/<part>/*_test.cc become one executable per part, run through CTest.
function(orvex_tests)
  orvex_all_internal(libs)
  file(GLOB dirs LIST_DIRECTORIES true ${PROJECT_SOURCE_DIR}/tests/*)
  foreach(dir ${dirs})
    if(IS_DIRECTORY ${dir})
      get_filename_component(part ${dir} NAME)
      file(GLOB srcs CONFIGURE_DEPENDS ${dir}/*.cc)
      if(srcs)
        add_executable(${part}_tests ${srcs})
        # A part's tests link only that part (and what it depends on), so
        # work in progress elsewhere never breaks them.
        if(TARGET orvex_${part})
          set(part_libs orvex_${part})
        else()
          set(part_libs ${libs})
        endif()
        target_link_libraries(${part}_tests PRIVATE ${part_libs} GTest::gtest_main GTest::gmock)
        # Tests run the real programs: build them first.
        set(programs ${ORVEX_PROGRAMS})
        list(REMOVE_ITEM programs "")
        if(programs)
          add_dependencies(${part}_tests ${programs})
        endif()
        target_include_directories(${part}_tests PRIVATE
          ${PROJECT_SOURCE_DIR}/src ${PROJECT_SOURCE_DIR}/tests)
        target_compile_definitions(${part}_tests PRIVATE
          ORVEX_BUILD_DIR="${PROJECT_BINARY_DIR}"
          ORVEX_SOURCE_DIR="${PROJECT_SOURCE_DIR}")
        gtest_discover_tests(${part}_tests DISCOVERY_TIMEOUT 60
                             PROPERTIES ENVIRONMENT "ORVEX_ROOT=" TIMEOUT 120)
      endif()
    endif()
  endforeach()
endfunction()

# bench/*.cc: one program each, printing its own figures; those named
# *_micro.cc are Google Benchmark programs.
function(orvex_benchmarks)
  orvex_all_internal(libs)
  find_package(benchmark REQUIRED)
  file(GLOB srcs CONFIGURE_DEPENDS ${PROJECT_SOURCE_DIR}/bench/*.cc)
  foreach(src ${srcs})
    get_filename_component(name ${src} NAME_WE)
    add_executable(${name} ${src})
    target_link_libraries(${name} PRIVATE ${libs})
    # Benchmarks generate their inputs with the tests' file makers.
    target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR}/src ${PROJECT_SOURCE_DIR}/tests)
    target_compile_definitions(${name} PRIVATE ORVEX_BUILD_DIR="${PROJECT_BINARY_DIR}")
    if(name MATCHES "_micro$")
      target_link_libraries(${name} PRIVATE benchmark::benchmark)
    endif()
  endforeach()
endfunction()

# fuzz/*.cc: libFuzzer targets, built only with clang and ORVEX_BUILD_FUZZ.
function(orvex_fuzzers)
  orvex_all_internal(libs)
  file(GLOB srcs CONFIGURE_DEPENDS ${PROJECT_SOURCE_DIR}/fuzz/*.cc)
  foreach(src ${srcs})
    get_filename_component(name ${src} NAME_WE)
    add_executable(${name} ${src})
    target_link_libraries(${name} PRIVATE ${libs})
    target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR}/src)
    target_link_options(${name} PRIVATE -fsanitize=fuzzer)
  endforeach()
endfunction()

# The install: libfileindex, its headers (with the generated version.h), the
# CMake package (find_package(Orvex) gives Orvex::fileindex) and fileindex.pc.
# Both package files find their files relative to where they are installed, so
# a tree installed under one prefix and moved, or staged with DESTDIR, still
# works; scripts/check-package depends on that.
function(orvex_install)
  include(CMakePackageConfigHelpers)
  set(cmake_dir ${CMAKE_INSTALL_LIBDIR}/cmake/Orvex)
  install(TARGETS fileindex EXPORT OrvexFileindexTargets
          LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR})
  install(DIRECTORY ${PROJECT_SOURCE_DIR}/include/ DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
  install(FILES ${PROJECT_BINARY_DIR}/include/orvex/version.h
          DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/orvex)

  # systemd units of the four daemons, for a real machine; their names are the
  # services the management operations start and stop. The format pages they
  # point to are installed beside them.
  set(ORVEX_DOC_DIR ${CMAKE_INSTALL_FULL_DOCDIR})
  file(GLOB units ${PROJECT_SOURCE_DIR}/packaging/systemd/*.service.in)
  foreach(unit ${units})
    get_filename_component(name ${unit} NAME_WLE)
    configure_file(${unit} ${PROJECT_BINARY_DIR}/systemd/${name} @ONLY)
    install(FILES ${PROJECT_BINARY_DIR}/systemd/${name} DESTINATION lib/systemd/system)
  endforeach()
  install(DIRECTORY ${PROJECT_SOURCE_DIR}/doc/ DESTINATION ${CMAKE_INSTALL_DOCDIR})

  install(EXPORT OrvexFileindexTargets NAMESPACE Orvex::
          FILE OrvexFileindexTargets.cmake DESTINATION ${cmake_dir})
  configure_package_config_file(${PROJECT_SOURCE_DIR}/cmake/OrvexConfig.cmake.in
                                ${PROJECT_BINARY_DIR}/OrvexConfig.cmake
                                INSTALL_DESTINATION ${cmake_dir})
  write_basic_package_version_file(${PROJECT_BINARY_DIR}/OrvexConfigVersion.cmake
                                   VERSION ${PROJECT_VERSION}
                                   COMPATIBILITY SameMajorVersion)
  install(FILES ${PROJECT_BINARY_DIR}/OrvexConfig.cmake
                ${PROJECT_BINARY_DIR}/OrvexConfigVersion.cmake
          DESTINATION ${cmake_dir})

  orvex_pkg_config_dirs()
  configure_file(${PROJECT_SOURCE_DIR}/cmake/fileindex.pc.in
                 ${PROJECT_BINARY_DIR}/fileindex.pc @ONLY)
  install(FILES ${PROJECT_BINARY_DIR}/fileindex.pc
          DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
endfunction()

# The prefix, libdir and includedir lines of fileindex.pc: relative to the .pc
# file's own directory (${pcfiledir}), which both pkg-config and pkgconf
# resolve, unless an install directory was given as an absolute path.
macro(orvex_pkg_config_dirs)
  if(IS_ABSOLUTE "${CMAKE_INSTALL_LIBDIR}")
    set(ORVEX_PC_PREFIX "${CMAKE_INSTALL_PREFIX}")
  else()
    file(RELATIVE_PATH up "/${CMAKE_INSTALL_LIBDIR}/pkgconfig" "/")
    string(REGEX REPLACE "/$" "" up "${up}")
    set(ORVEX_PC_PREFIX "\${pcfiledir}/${up}")
  endif()
  foreach(kind LIBDIR INCLUDEDIR)
    if(IS_ABSOLUTE "${CMAKE_INSTALL_${kind}}")
      set(ORVEX_PC_${kind} "${CMAKE_INSTALL_${kind}}")
    else()
      set(ORVEX_PC_${kind} "\${prefix}/${CMAKE_INSTALL_${kind}}")
    endif()
  endforeach()
endmacro()
