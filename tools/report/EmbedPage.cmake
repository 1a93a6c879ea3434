# Assembles the parts of the page and writes them as two C++ strings: the page before the data, and the
# page after it. Takes PAGE, the folder of the parts, D3, the script, and OUTPUT. If D3 is empty, so are
# both strings.

set(page "@DATA@")
if(D3)
    file(READ ${PAGE}/report.html page)
    set(names STYLE D3 SCRIPT)
    set(files ${PAGE}/report.css ${D3} ${PAGE}/report.js)
    foreach(name file IN ZIP_LISTS names files)
        file(READ ${file} text)
        string(REPLACE "@${name}@" "${text}" page "${page}")
    endforeach()
endif()

set(source "// Made from the parts of the page.\n\n#include \"report/Page.hpp\"\n\nnamespace Report {\n")
string(FIND "${page}" "@DATA@" place)
string(SUBSTRING "${page}" 0 ${place} Head)
math(EXPR place "${place} + 6")
string(SUBSTRING "${page}" ${place} -1 Tail)
foreach(part Head Tail)
    string(HEX "${${part}}" bytes)
    string(REGEX REPLACE "(................................)" "\\1\n" bytes "${bytes}")
    string(REGEX REPLACE "([0-9a-f][0-9a-f])" "'\\\\x\\1'," bytes "${bytes}")
    string(APPEND source "\nnamespace {\nconst char ${part}Bytes[] = {\n${bytes}'\\0'};\n}\n"
        "std::string_view Page${part}() { return {${part}Bytes, sizeof ${part}Bytes - 1}; }\n")
endforeach()
file(WRITE ${OUTPUT} "${source}\n}  // namespace Report\n")
