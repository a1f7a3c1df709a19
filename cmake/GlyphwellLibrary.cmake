# glyphwell_library(NAME DEPS...): one static library per subsystem folder, made of every
# .cpp file in that folder. Headers are included as "folder/Header.h" from the project root.
function(glyphwell_library name)
    file(GLOB sources CONFIGURE_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/*.cpp)
    add_library(${name} STATIC ${sources})
    target_include_directories(${name} PUBLIC
        $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}>
        $<INSTALL_INTERFACE:include/glyphwell>)
    target_link_libraries(${name} PUBLIC ${ARGN})
endfunction()

# glyphwell_test_suite(NAME FOLDER DEPS...): one GoogleTest executable made of every .cpp file
# in tests/FOLDER, registered with CTest test by test.
function(glyphwell_test_suite name folder)
    file(GLOB sources CONFIGURE_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/${folder}/*.cpp)
    if(NOT sources)
        return()
    endif()
    add_executable(${name} ${sources})
    target_include_directories(${name} PRIVATE ${CMAKE_CURRENT_SOURCE_DIR})
    target_link_libraries(${name} PRIVATE ${ARGN} GTest::gtest GTest::gmock GTest::gtest_main)
    set_target_properties(${name} PROPERTIES AUTOMOC ON)
    # Widgets run on Qt's offscreen platform; nothing needs a display.
    gtest_discover_tests(${name} DISCOVERY_TIMEOUT 60
        PROPERTIES ENVIRONMENT "GLYPHWELL_SOURCE_DIR=${PROJECT_SOURCE_DIR};QT_QPA_PLATFORM=offscreen")
endfunction()
