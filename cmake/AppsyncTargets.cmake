# What the CMakeLists.txt of the folders are written with. Each folder globs its own sources, so a new
# file needs no edit of any CMakeLists.txt.

# Adds the sources of the calling folder and its rooms to the library TARGET.
function(appsync_add_folder target)
    file(GLOB_RECURSE sources CONFIGURE_DEPENDS "${CMAKE_CURRENT_SOURCE_DIR}/*.cpp" "${CMAKE_CURRENT_SOURCE_DIR}/*.h")
    list(FILTER sources EXCLUDE REGEX "/main\\.cpp$")
    target_sources(${target} PRIVATE "${CMAKE_CURRENT_SOURCE_DIR}/CMakeLists.txt" ${sources})
endfunction()

# Compiles the sources of TARGET three dozen at a time, where that is asked for.
function(appsync_merge_sources target)
    if(APPSYNC_MERGE_SOURCES)
        set_target_properties(${target} PROPERTIES UNITY_BUILD ON UNITY_BUILD_BATCH_SIZE 36)
        if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
            # A source that is included looks to it like a header, which many may include.
            target_compile_options(${target} PRIVATE -Wno-subobject-linkage)
        endif()
    endif()
endfunction()

# Settings that every library shares: includes are written from the root of the tree, or of the installed headers.
function(appsync_finish_library target)
    set_target_properties(${target} PROPERTIES LINKER_LANGUAGE CXX)
    target_include_directories(${target} PUBLIC "$<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}>"
                                                "$<INSTALL_INTERFACE:include/appsync>")
    target_compile_features(${target} PUBLIC cxx_std_20)
    appsync_merge_sources(${target})
endfunction()

# A static library TARGET of the calling folder's sources, linked with LIBRARIES.
function(appsync_library target)
    add_library(${target} STATIC)
    appsync_add_folder(${target})
    appsync_finish_library(${target})
    target_link_libraries(${target} PUBLIC ${ARGN})
endfunction()

# A loadable module TARGET of the plug-in that exports the function which gives its table, and nothing else. SOURCES, if
# there are any, have that function in the plug-in's place.
function(appsync_plug_in_module target)
    set(exports "${PROJECT_SOURCE_DIR}/cmake/module.map")
    add_library(${target} MODULE "${exports}" ${ARGN})
    set_target_properties(${target} PROPERTIES PREFIX "" LINKER_LANGUAGE CXX LINK_DEPENDS "${exports}")
    target_include_directories(${target} PRIVATE "${PROJECT_SOURCE_DIR}")
    target_link_libraries(${target} PRIVATE appsync_plugin)
    target_link_options(${target} PRIVATE "LINKER:--version-script=${exports}")
    if(NOT ARGN)
        target_link_options(${target} PRIVATE "LINKER:--undefined=appsyncPlugInTable")
    endif()
endfunction()

# The unit tests of the calling folder and its rooms as one executable test_<folder>, linked with LIBRARIES.
# A folder without a .cpp file has no executable.
function(appsync_tests)
    get_filename_component(folder "${CMAKE_CURRENT_SOURCE_DIR}" NAME)
    file(GLOB_RECURSE sources CONFIGURE_DEPENDS "${CMAKE_CURRENT_SOURCE_DIR}/*.cpp")
    if(NOT sources)
        return()
    endif()
    set(target test_${folder})
    add_executable(${target} ${sources})
    target_include_directories(${target} PRIVATE "${PROJECT_SOURCE_DIR}")
    target_link_libraries(${target} PRIVATE ${ARGN} GTest::gmock GTest::gtest GTest::gtest_main Threads::Threads)
    target_precompile_headers(${target} REUSE_FROM appsync_test_headers)
    set_target_properties(${target} PROPERTIES RUNTIME_OUTPUT_DIRECTORY "${PROJECT_BINARY_DIR}/tests")
    appsync_merge_sources(${target})
    add_test(NAME ${target} COMMAND ${target})
endfunction()
