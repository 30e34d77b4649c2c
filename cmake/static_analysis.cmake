# The target "tidy": clang-tidy on every C++ source of the tree. A source is looked at anew when it or a header of ours
# that it includes changed, and when clang-tidy or its rules did. Needs a tree in which each source is compiled alone,
# but for the tests: many of them are read as one, as GoogleTest takes longer to read than all of them.
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

# The analyzer of paths takes eight times what all other checks of the tests take together, and sanitizers run there.
function(analyse_bundles target count)
    get_target_property(folder ${target} BINARY_DIR)
    get_target_property(size ${target} UNITY_BUILD_BATCH_SIZE)
    math(EXPR last "(${count} - 1) / ${size}")
    foreach(bundle RANGE ${last})
        analyse(${folder}/CMakeFiles/${target}.dir/Unity/unity_${bundle}_cxx.cxx ${target}/${bundle}
            --checks=-clang-analyzer-*,-bugprone-suspicious-include)
    endforeach()
    set(analysed ${analysed} PARENT_SCOPE)
endfunction()

function(analyse_target target folder)
    get_target_property(sources ${target} SOURCES)
    get_target_property(is_bundled ${target} UNITY_BUILD)
    set(count 0)
    foreach(source IN LISTS sources)
        cmake_path(ABSOLUTE_PATH source BASE_DIRECTORY ${folder} OUTPUT_VARIABLE file)
        cmake_path(RELATIVE_PATH file BASE_DIRECTORY ${PROJECT_SOURCE_DIR} OUTPUT_VARIABLE name)
        get_source_file_property(options ${file} DIRECTORY ${folder} COMPILE_OPTIONS)
        if(NOT source MATCHES "\\.cpp$" OR name MATCHES "^(build|bench/)")
            continue()
        elseif(is_bundled AND NOT options)
            math(EXPR count "${count} + 1")
        else()
            analyse(${file} ${name})
        endif()
    endforeach()
    if(count GREATER 0)
        analyse_bundles(${target} ${count})
    endif()
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

if(CLANG_TIDY AND CMAKE_GENERATOR STREQUAL "Ninja" AND NOT CMAKE_UNITY_BUILD AND CMAKE_DISABLE_PRECOMPILE_HEADERS)
    set_target_properties(tavi_tests PROPERTIES UNITY_BUILD ON)
    analyse_folder(${PROJECT_SOURCE_DIR})
    add_custom_target(tidy DEPENDS ${analysed})
endif()
