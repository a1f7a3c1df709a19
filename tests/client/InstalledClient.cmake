# The C example built against the installed library only (headers, pkg-config file, CMake
# package) and run against the real agent.
set(client_sanitize_flags "")
if(GLYPHWELL_SANITIZE)
    set(client_sanitize_flags "-fsanitize=address,undefined")
endif()
set(client_agent "")
if(TARGET GlyphwellUIAgent)
    set(client_agent $<TARGET_FILE:GlyphwellUIAgent>)
endif()
add_test(NAME client_installed_example
    COMMAND ${CMAKE_CURRENT_SOURCE_DIR}/client/installed-example.sh
            ${PROJECT_BINARY_DIR} ${PROJECT_SOURCE_DIR}/client/examples/ask-download.c
            "${client_sanitize_flags}" "${client_agent}")
set_tests_properties(client_installed_example PROPERTIES
    TIMEOUT 120 SKIP_RETURN_CODE 77 LABELS e2e)
