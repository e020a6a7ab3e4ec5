option(BRENIX_WARNINGS_AS_ERRORS "Stop at the first warning" OFF)

# The warnings under which every target of the project is clean.
function(brenix_warnings target)
    target_compile_options(${target} PRIVATE
        -Wall -Wextra -Wpedantic -Wshadow -Wconversion -Wsign-conversion)
    if(BRENIX_WARNINGS_AS_ERRORS)
        target_compile_options(${target} PRIVATE -Werror)
    endif()
endfunction()

# Clang leaves its sanitizers to the program: then a library cannot name all that it needs, and a C
# program has to be linked as C++.
if(CMAKE_CXX_FLAGS MATCHES "-fsanitize")
    set(BRENIX_C_LINKER_LANGUAGE CXX)
else()
    set(BRENIX_C_LINKER_LANGUAGE C)
    set(BRENIX_NO_UNDEFINED -Wl,-z,defs)
endif()

# What hardens a program in use, as Debian builds its packages. The sanitizers watch the rest.
add_link_options(-Wl,-z,relro,-z,now,-z,noexecstack,-z,text)
if(NOT CMAKE_CXX_FLAGS MATCHES "-fsanitize")
    add_compile_options(
        "$<$<CONFIG:Release,RelWithDebInfo>:-fstack-protector-strong;-U_FORTIFY_SOURCE;-D_FORTIFY_SOURCE=2>")
endif()
