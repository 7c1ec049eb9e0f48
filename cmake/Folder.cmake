# One target a folder, with private link lines.
#
#   marubackup_folder(NAME SOURCES file... [PUBLIC_HEADERS header...] USES target...)
#
# A folder sees its own headers and those of the folders that it USES, and no
# others: each folder's headers are staged in a tree of their own below the
# build folder, and that tree is all that a user of the folder gets. An include
# that the layers do not allow does not build.

add_library(marubackup_objects INTERFACE)

function(marubackup_folder name)
    cmake_parse_arguments(ARG "" "" "SOURCES;PUBLIC_HEADERS;USES" ${ARGN})
    set(target marubackup_${name})
    set(staged ${PROJECT_BINARY_DIR}/include/${name})

    file(MAKE_DIRECTORY ${staged}/marubackup)
    file(CREATE_LINK ${PROJECT_SOURCE_DIR}/${name} ${staged}/${name} SYMBOLIC)
    foreach(header IN LISTS ARG_PUBLIC_HEADERS)
        file(CREATE_LINK ${PROJECT_SOURCE_DIR}/include/marubackup/${header} ${staged}/marubackup/${header} SYMBOLIC)
    endforeach()

    add_library(${target} OBJECT ${ARG_SOURCES})
    target_include_directories(${target} PUBLIC ${staged})
    target_link_libraries(${target} PRIVATE marubackup_warnings ${ARG_USES})
    target_sources(marubackup_objects INTERFACE $<TARGET_OBJECTS:${target}>)
endfunction()
