# The target "tidy": clang-tidy on every C++ source of the tree, those that are compiled as one in one call, as half of
# the time would be spent on reading the headers that they share. They are looked at anew when one of them or a header
# of ours that they include changed, and when clang-tidy or its rules did.
find_program(CLANG_TIDY NAMES clang-tidy-22 clang-tidy) # from 21 on it does not walk through the standard library
set(analysed)

# One call of clang-tidy, and the name of its results.
function(analyse file name)
    set(stamp ${PROJECT_BINARY_DIR}/tidy/${name}.ok)
    if(NOT stamp IN_LIST analysed)
        add_custom_command(OUTPUT ${stamp} VERBATIM
            COMMENT "clang-tidy ${name}"
            COMMAND ${PROJECT_SOURCE_DIR}/cmake/static_analysis.sh
                ${PROJECT_BINARY_DIR} tidy/${name} ${CLANG_TIDY} ${ARGN} ${file}
            DEPENDS ${file} ${CLANG_TIDY} ${PROJECT_SOURCE_DIR}/.clang-tidy
            DEPFILE ${PROJECT_BINARY_DIR}/tidy/${name}.d)
        list(APPEND analysed ${stamp})
    endif()
    set(analysed ${analysed} PARENT_SCOPE)
endfunction()

# The name of what a source is compiled as a part of, or nothing. Counts in "count", of those that are put together by
# their number.
function(find_bundle target source file)
    get_target_property(is_bundled ${target} UNITY_BUILD)
    get_target_property(mode ${target} UNITY_BUILD_MODE)
    get_target_property(size ${target} UNITY_BUILD_BATCH_SIZE)
    get_target_property(folder ${target} SOURCE_DIR)
    get_source_file_property(is_alone ${file} TARGET_DIRECTORY ${target} SKIP_UNITY_BUILD_INCLUSION)
    get_source_file_property(options ${file} TARGET_DIRECTORY ${target} COMPILE_OPTIONS)
    set(bundle)
    if(is_bundled AND NOT is_alone AND NOT options)
        if(mode STREQUAL "GROUP")
            get_source_file_property(bundle ${file} TARGET_DIRECTORY ${target} UNITY_GROUP)
        else()
            math(EXPR bundle "${count} / ${size}")
            math(EXPR count "${count} + 1")
        endif()
    endif()
    set(bundle "${bundle}" PARENT_SCOPE)
    set(count ${count} PARENT_SCOPE)
endfunction()

function(analyse_target target folder)
    get_target_property(sources ${target} SOURCES)
    get_target_property(built ${target} BINARY_DIR)
    set(count 0)
    set(options)
    if(target STREQUAL "tavi_tests")
        # The analyzer of paths takes eight times what all other checks of the tests take together, and sanitizers run
        # there.
        set(options --checks=-clang-analyzer-*)
    endif()
    foreach(source IN LISTS sources)
        cmake_path(ABSOLUTE_PATH source BASE_DIRECTORY ${folder} OUTPUT_VARIABLE file)
        cmake_path(RELATIVE_PATH file BASE_DIRECTORY ${PROJECT_SOURCE_DIR} OUTPUT_VARIABLE name)
        if(NOT source MATCHES "\\.cpp$" OR name MATCHES "^(build|bench/)")
            continue()
        endif()
        find_bundle(${target} ${source} ${file})
        if(bundle STREQUAL "")
            analyse(${file} ${name})
        else()
            analyse(${built}/CMakeFiles/${target}.dir/Unity/unity_${bundle}_cxx.cxx ${target}/${bundle} ${options})
        endif()
    endforeach()
    set(analysed ${analysed} PARENT_SCOPE)
endfunction()

function(analyse_folder folder)
    get_property(targets DIRECTORY ${folder} PROPERTY BUILDSYSTEM_TARGETS)
    foreach(target IN LISTS targets)
        analyse_target(${target} ${folder})
    endforeach()
    get_property(below DIRECTORY ${folder} PROPERTY SUBDIRECTORIES)
    foreach(subfolder IN LISTS below)
        analyse_folder(${subfolder})
    endforeach()
    set(analysed ${analysed} PARENT_SCOPE)
endfunction()

if(CLANG_TIDY AND CMAKE_GENERATOR STREQUAL "Ninja" AND CMAKE_DISABLE_PRECOMPILE_HEADERS)
    analyse_folder(${PROJECT_SOURCE_DIR})
    add_custom_target(tidy DEPENDS ${analysed})
endif()
