"""generate.py COMPILER OUTPUT HEADER...: writes the C source of the extension module veltra._codecs.

Its declarations are the headers themselves, as the C preprocessor leaves them, so that no signature can drift from the library
that it is linked with. The headers are named as an include names them, below the folder that the program runs in.
"""
import re
import subprocess
import sys

import cffi

# Called from C; veltra defines them. They are declared in Glue.h too, so that the compiler compares the two.
CALLBACKS = """
extern "Python+C" {
    void veltraTakeMessage(const char* text, uint64_t length);
    DERReturn veltraJudge(DERTag tag, const Img4PropertyValue* value, uint32_t selector, void* context);
    const uint8_t* veltraTrustedDigest(const Img4Record* record, void* context);
    DERReturn veltraReadDomainFile(const char* name, bool mayBeMissing, DERItem* contents, void* context);
}
void free(void* memory);
"""


def declarations(compiler, headers):
    text = "".join(open(header, encoding="utf-8").read() for header in headers)
    # Without the headers of the system, whose types cffi knows, and without the compiler's own extensions.
    local = re.sub(r"^#include .*", "", text, flags=re.MULTILINE)
    plain = subprocess.run([compiler, "-E", "-P", "-U__GNUC__", "-xc", "-"], input=local, stdout=subprocess.PIPE, check=True,
                           text=True).stdout
    functions = re.findall(r"^typedef \w+ (\w+)\([^;]*;", plain, re.MULTILINE)
    plain = re.sub(rf"^extern (?:{'|'.join(functions) or '-'}) \w+;", "", plain, flags=re.MULTILINE)  # of a function's type
    numbers = re.findall(r"^#define (DERTag\w+|Img4\w+) +(?:UINT|\(\(DERR|\d)", text, re.MULTILINE)
    return plain + "".join(f"#define {number} ...\n" for number in numbers) + CALLBACKS


def main():
    compiler, output, *headers = sys.argv[1:]
    builder = cffi.FFI()
    builder.cdef(declarations(compiler, headers))
    builder.set_source("veltra._codecs", "#include <stdlib.h>\n" + "".join(f'#include "{header}"\n' for header in headers))
    builder.emit_c_code(output)


main()
