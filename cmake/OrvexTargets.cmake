# Target helpers. Every source, test, benchmark and program is found by glob
# (re-globbed at build time), so a file that exists is a file that is built:
# no test can be silently dropped from the build.

set(ORVEX_SUBSYSTEMS "" CACHE INTERNAL "")
set(ORVEX_PROGRAMS "" CACHE INTERNAL "")
set(ORVEX_STATIC_LIBS "" CACHE INTERNAL "")

# A static internal library from every .cc of DIR; an empty placeholder
# (INTERFACE) while the directory has no sources yet.
function(orvex_internal_library name)
  cmake_parse_arguments(ARG "" "DIR" "DEPS" ${ARGN})
  file(GLOB srcs CONFIGURE_DEPENDS ${PROJECT_SOURCE_DIR}/${ARG_DIR}/*.cc)
  if(srcs)
    add_library(${name} STATIC ${srcs})
    target_link_libraries(${name} PUBLIC ${ARG_DEPS})
    target_include_directories(${name} PUBLIC
      $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}/include>
      PRIVATE ${PROJECT_SOURCE_DIR}/src)
    target_compile_definitions(${name} PRIVATE ORVEX_BUILDING_LIBRARY)
    set(ORVEX_STATIC_LIBS "${ORVEX_STATIC_LIBS};${name}" CACHE INTERNAL "")
  else()
    add_library(${name} INTERFACE)
    target_link_libraries(${name} INTERFACE ${ARG_DEPS})
    target_include_directories(${name} INTERFACE
      $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}/include>)
  endif()
endfunction()

function(orvex_subsystem sub)
  cmake_parse_arguments(ARG "" "" "DEPS" ${ARGN})
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
  target_include_directories(fileindex PUBLIC
    $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}/include>
    $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}>)
  set_target_properties(fileindex PROPERTIES
    VERSION ${PROJECT_VERSION} SOVERSION ${PROJECT_VERSION_MAJOR})
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
        if(prog STREQUAL "kalopmxnotify")
          # The library runs the notification tool from the platform's own
          # fixed place (under ORVEX_ROOT when that is set).
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
    target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR}/src)
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

function(orvex_install)
  install(TARGETS fileindex EXPORT OrvexFileindexTargets
          LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
          INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
  install(DIRECTORY ${PROJECT_SOURCE_DIR}/include/ DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
  configure_file(${PROJECT_SOURCE_DIR}/cmake/fileindex.pc.in
                 ${PROJECT_BINARY_DIR}/fileindex.pc @ONLY)
  install(FILES ${PROJECT_BINARY_DIR}/fileindex.pc
          DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
endfunction()
