# Writes OUT, a C++ source defining NAME (unsigned char array) and NAME##Size from the bytes of
# IN, so that a program carries the file. Run with cmake -P.
file(READ "${IN}" content HEX)
string(LENGTH "${content}" digits)
math(EXPR size "${digits} / 2")
string(REGEX REPLACE "([0-9a-f][0-9a-f])" "0x\\1," bytes "${content}")
string(REGEX REPLACE "((0x..,){24})" "\\1\n" bytes "${bytes}")
file(WRITE "${OUT}.tmp"
     "// Generated from ${IN_NAME}; edit that file instead.\n"
     "#include \"${HEADER}\"\n\n"
     "extern const unsigned char ${NAME}[] = {\n${bytes}0};\n"
     "extern const size_t ${NAME}Size = ${size};\n")
file(RENAME "${OUT}.tmp" "${OUT}")
