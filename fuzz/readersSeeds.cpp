#include <string>

#include "fuzz/Seeds.h"

int main(int count, char** arguments) {
    using namespace std::string_literals;
    return writeSeeds<std::string>(
        count, arguments,
        {
            "\0<?xml version=\"1.0\"?><plist><dict><key>ProductBuildVersion</key><string>1A2</string><key>a</key>"
            "<array><integer>-1</integer><true/><data>AA==</data><real>1</real></array></dict></plist>"s,
            "\1{\"answers\": {\"HWModelStr\": \"M3\", \"VanterUID\": {\"$data\": \"0bad\"}, \"x\": [1.5, null]}}",
            "\2{\"os_version\": \"Quennel 1 (1A2)\", \"deep\": [[{}]]}",
            "\3AAEC/w==",
            "\4https://user@[::1]:8443/a%20b/../c?d=e#f",
            "\5-----BEGIN CERTIFICATE-----\nMAA=\n-----END CERTIFICATE-----\n",
            "\6ACCESSKEY\nsecret/of+the=key\n",
            "\7panic-full\n{\"os_version\": \"1\"}\nbacktrace\n",
            "\10HTTP/1.1 100 Continue\r\n\r\nHTTP/1.1 200 OK\r\nContent-Length: 2\r\n\r\nok",
            "\10HTTP/1.1 200 OK\r\nTransfer-Encoding: gzip, chunked\r\n\r\n2\r\nok\r\n0\r\n\r\n",
        });
}
