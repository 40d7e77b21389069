#include <chrono>
#include <string>
#include <string_view>
#include <thread>
#include <utility>

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <netinet/in.h>
#include <sys/socket.h>

#include "platform/FileDescriptor.h"
#include "platform/linux/services/http/ClientShelf.h"

using namespace std::chrono_literals;
using http::ClientShelf;

namespace {

// Answers one request and waits until the client closes the connection.
void serve(int listener) {
    constexpr std::string_view answer = "HTTP/1.1 200 OK\r\nContent-Length: 0\r\n\r\n";
    const FileDescriptor connection(accept(listener, nullptr, nullptr));
    for (char request[4096]; recv(connection.get(), request, sizeof request, 0) > 0;)
        send(connection.get(), answer.data(), answer.size(), MSG_NOSIGNAL);
}

TEST(ClientShelfTest, ConnectionsAreClosedThatNobodyUsesAndThoseOfAClientThatIsTooOld) {
    const FileDescriptor listener(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in address = {AF_INET, 0, {htonl(INADDR_LOOPBACK)}, {}};
    socklen_t length = sizeof address;
    auto* const where = reinterpret_cast<sockaddr*>(&address);
    ASSERT_EQ(bind(listener.get(), where, length) | listen(listener.get(), 1), 0);
    ASSERT_EQ(getsockname(listener.get(), where, &length), 0);
    http::Request request = {.method = "GET", .limits = {.timeout = 10s}};
    request.url = "http://127.0.0.1:" + std::to_string(ntohs(address.sin_port));
    for (const auto& [longestIdle, longestLife] : {std::pair(10ms, 1h), std::pair(3600000ms, 0h)}) {
        std::thread server(serve, listener.get());
        ClientShelf shelf(longestIdle, longestLife);
        ClientShelf::Loan loan = shelf.take({});
        EXPECT_TRUE(loan.client->exchange(request).isSuccess());
        shelf.put(std::move(loan));
        shelf.put(shelf.take({})); // another user
        server.join();
    }
}

} // namespace
