# The target "tidy": clang-tidy on every C++ source of the tree. A source is looked at anew when it or a header of ours
# that it includes changed, and when clang-tidy or its rules did. Needs a tree in which each source is compiled alone.
find_program(CLANG_TIDY NAMES clang-tidy-22 clang-tidy) # from 21 on it does not walk through the standard library
set(analysed)

function(analyse_folder folder)
    get_property(targets DIRECTORY ${folder} PROPERTY BUILDSYSTEM_TARGETS)
    foreach(target IN LISTS targets)
        get_target_property(sources ${target} SOURCES)
        foreach(source IN LISTS sources)
            if(NOT source MATCHES "\\.cpp$")
                continue()
            endif()
            cmake_path(ABSOLUTE_PATH source BASE_DIRECTORY ${folder} OUTPUT_VARIABLE file)
            cmake_path(RELATIVE_PATH file BASE_DIRECTORY ${PROJECT_SOURCE_DIR} OUTPUT_VARIABLE name)
            set(stamp ${PROJECT_BINARY_DIR}/tidy/${name}.ok)
            if(name MATCHES "^(build|bench/)" OR stamp IN_LIST analysed)
                continue()
            endif()
            file(GLOB rules ${folder}/.clang-tidy)
            add_custom_command(OUTPUT ${stamp} VERBATIM
                COMMENT "clang-tidy ${name}"
                COMMAND ${PROJECT_SOURCE_DIR}/cmake/static_analysis.sh
                    ${CLANG_TIDY} ${PROJECT_BINARY_DIR} ${file} tidy/${name}
                DEPENDS ${file} ${CLANG_TIDY} ${PROJECT_SOURCE_DIR}/.clang-tidy ${rules}
                DEPFILE ${PROJECT_BINARY_DIR}/tidy/${name}.d)
            list(APPEND analysed ${stamp})
        endforeach()
    endforeach()
    get_property(below DIRECTORY ${folder} PROPERTY SUBDIRECTORIES)
    foreach(subfolder IN LISTS below)
        analyse_folder(${subfolder})
    endforeach()
    set(analysed ${analysed} PARENT_SCOPE)
endfunction()

if(CLANG_TIDY AND CMAKE_GENERATOR STREQUAL "Ninja" AND NOT CMAKE_UNITY_BUILD AND CMAKE_DISABLE_PRECOMPILE_HEADERS)
    analyse_folder(${PROJECT_SOURCE_DIR})
    add_custom_target(tidy DEPENDS ${analysed})
endif()
