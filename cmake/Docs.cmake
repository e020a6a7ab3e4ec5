# The target docs: the reference of the public headers as HTML in the folder reference of the build. A
# function that is not documented is an error.
find_package(Doxygen)
if(DOXYGEN_FOUND)
    set(DOXYGEN_OUTPUT_DIRECTORY ${PROJECT_BINARY_DIR}/reference)
    set(DOXYGEN_HTML_OUTPUT .)
    set(DOXYGEN_STRIP_FROM_PATH include core/include)
    set(DOXYGEN_WARN_AS_ERROR FAIL_ON_WARNINGS)
    set(DOXYGEN_MACRO_EXPANSION YES)
    set(DOXYGEN_EXPAND_ONLY_PREDEF YES)
    set(DOXYGEN_PREDEFINED CODER_API:= CODER_NOEXCEPT:= BRENIXCORE_API:= BRENIXCORE_PLUGIN_SHARED:=
        BRENIXPLUGIN_SHARED:= __cplusplus=201703L)
    set(DOXYGEN_EXCLUDE_SYMBOLS brenixcore::plugin::detail *::Impl)
    doxygen_add_docs(docs include core/include)
endif()
