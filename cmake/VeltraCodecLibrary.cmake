include(CMakePackageConfigHelpers)

# veltra_codec_library(<name> SOURCES ... HEADERS ... [OBJECTS <target>...] [CODECS <name>...] [PLATFORM <target>...]
#                      [REQUIRES <pkg>...])
#
# One C-callable codec, compiled once and offered twice: the static library `<name>` and the shared library
# `<name>-shared` (lib<name>.a, lib<name>.so). Both are installed with HEADERS, a pkg-config file and the CMake package
# `veltra`. OBJECTS are object libraries that go into both, CODECS are other codecs that it stands on, PLATFORM the static
# libraries of the platform that go into it, REQUIRES the pkg-config modules that a static link needs.
function(veltra_codec_library name)
    cmake_parse_arguments(ARG "" "" "SOURCES;HEADERS;OBJECTS;CODECS;PLATFORM;REQUIRES" ${ARGN})
    add_library(${name}-objects OBJECT ${ARG_SOURCES})
    target_compile_options(${name}-objects PRIVATE
        $<$<COMPILE_LANGUAGE:CXX>:-fno-exceptions -fno-rtti -fno-threadsafe-statics>)

    set(objects $<TARGET_OBJECTS:${name}-objects>)
    foreach(library IN LISTS ARG_OBJECTS)
        list(APPEND objects $<TARGET_OBJECTS:${library}>)
    endforeach()
    add_library(${name} STATIC ${objects})
    add_library(${name}-shared SHARED ${objects})
    set_target_properties(${name}-shared PROPERTIES
        OUTPUT_NAME ${name} VERSION ${PROJECT_VERSION} SOVERSION ${PROJECT_VERSION_MAJOR}
        # The codecs that it stands on are installed beside it.
        INSTALL_RPATH "$ORIGIN")
    target_link_options(${name}-shared PRIVATE -Wl,--exclude-libs,ALL)
    foreach(codec IN LISTS ARG_CODECS)
        target_link_libraries(${name} PUBLIC ${codec})
        target_link_libraries(${name}-shared PUBLIC ${codec}-shared)
    endforeach()
    set(private_libraries "")
    foreach(library IN LISTS ARG_PLATFORM)
        target_link_libraries(${name} PUBLIC ${library})
        target_link_libraries(${name}-shared PRIVATE ${library})
        string(APPEND private_libraries " -l${library}")
    endforeach()

    get_filename_component(room ${CMAKE_CURRENT_SOURCE_DIR} NAME)
    install(FILES ${ARG_HEADERS} DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}/veltra/${room})
    foreach(target ${name} ${name}-shared)
        target_include_directories(${target} INTERFACE
            $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}>
            $<INSTALL_INTERFACE:${CMAKE_INSTALL_INCLUDEDIR}/veltra>)
    endforeach()
    install(TARGETS ${name} ${name}-shared EXPORT veltra
        ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR}
        LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR})

    list(JOIN ARG_CODECS ", " VELTRA_PC_REQUIRES)
    list(JOIN ARG_REQUIRES ", " VELTRA_PC_PRIVATE_REQUIRES)
    file(RELATIVE_PATH VELTRA_PC_PREFIX ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig ${CMAKE_INSTALL_PREFIX})
    set(VELTRA_PC_NAME ${name})
    set(VELTRA_PC_PRIVATE_LIBS "${private_libraries}")
    configure_file(${PROJECT_SOURCE_DIR}/cmake/codec.pc.in ${CMAKE_CURRENT_BINARY_DIR}/${name}.pc @ONLY)
    install(FILES ${CMAKE_CURRENT_BINARY_DIR}/${name}.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
endfunction()
