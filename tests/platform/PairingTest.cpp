#include "platform/Pairing.h"

#include <cstdint>
#include <future>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include "platform/FileDescriptor.h"

namespace {

using namespace std::string_literals;

// A pairing server on the loopback device that gives prepared answers, one to each connection.
class Server {
public:
    explicit Server(std::vector<std::string> answers) : listener_(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_in address = {};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t length = sizeof address;
        auto* const generic = reinterpret_cast<sockaddr*>(&address);
        EXPECT_EQ(::bind(listener_.get(), generic, length), 0);
        EXPECT_EQ(::listen(listener_.get(), 8), 0);
        EXPECT_EQ(::getsockname(listener_.get(), generic, &length), 0);
        port_ = ntohs(address.sin_port);
        requests_ = std::async(std::launch::async, [this, answers = std::move(answers)] {
            std::vector<std::string> requests;
            for (const std::string& answer : answers)
                requests.push_back(serve(answer));
            return requests;
        });
    }
    Server(const Server&) = delete;
    Server& operator=(const Server&) = delete;
    ~Server() { stop(); }

    std::string url() const { return "http://127.0.0.1:" + std::to_string(port_) + "/corvo"; }

    // "<request line>: <body>" of each request; one that has not come by now is "(cut off)".
    std::vector<std::string> requests() {
        stop();
        return requests_.get();
    }

private:
    void stop() const { ::shutdown(listener_.get(), SHUT_RDWR); }

    // Reads one request, whose body is shorter than its header, and answers it.
    std::string serve(const std::string& answer) const {
        const FileDescriptor client(::accept4(listener_.get(), nullptr, nullptr, SOCK_CLOEXEC));
        EXPECT_TRUE(isClosedOnExec(client.get()));
        std::string request;
        char piece[1024];
        while (!isWhole(request)) {
            const ssize_t count = ::recv(client.get(), piece, sizeof piece, 0);
            if (count <= 0)
                return "(cut off)";
            request.append(piece, static_cast<std::size_t>(count));
        }
        EXPECT_EQ(::send(client.get(), answer.data(), answer.size(), MSG_NOSIGNAL), ssize_t(answer.size()));
        return request.substr(0, request.find('\r')) + ": " + request.substr(request.find("\r\n\r\n") + 4);
    }

    // Whether no program that this process starts inherits the other end of a connection.
    static bool isClosedOnExec(int client) {
        sockaddr_in peer = {}, own = {};
        socklen_t length = sizeof peer;
        EXPECT_EQ(::getpeername(client, reinterpret_cast<sockaddr*>(&peer), &length), 0);
        for (int end = 3; end < 1024; ++end) {
            length = sizeof own;
            if (::getsockname(end, reinterpret_cast<sockaddr*>(&own), &length) == 0 && own.sin_family == AF_INET &&
                own.sin_port == peer.sin_port)
                return (::fcntl(end, F_GETFD) & FD_CLOEXEC) != 0;
        }
        return false;
    }

    static bool isWhole(const std::string& request) {
        const std::size_t end = request.find("\r\n\r\n");
        const std::size_t stated = request.find("Content-Length: ");
        return end != std::string::npos && stated < end &&
               request.size() - end - 4 >= std::stoul(request.substr(stated + 16));
    }

    FileDescriptor listener_;
    in_port_t port_ = 0;
    std::future<std::vector<std::string>> requests_;
};

std::string ok(const std::string& body) {
    return "HTTP/1.1 200 OK\r\nConnection: close\r\nContent-Length: " + std::to_string(body.size()) + "\r\n\r\n" + body;
}

const std::string noContent = "HTTP/1.1 204 No Content\r\nConnection: close\r\n\r\n";

TEST(Pairing, theCallbackGetsTheTicketByteForByteAndTheServerItsResult) {
    std::string everyByte;
    for (int round = 0; round < 4096; ++round)
        everyByte += static_cast<char>(round * 7 % 256);
    const std::string chunked = "HTTP/1.1 201 Created\r\nConnection: close\r\nTransfer-Encoding: chunked\r\n\r\n"
                                "3\r\na\0b\r\n2\r\n\r\n\r\n0\r\n\r\n"s;
    const struct {
        std::string answer;
        std::string ticket;
        std::int32_t result;
    } rows[] = {
        {ok("the ticket"), "the ticket", 0},
        {ok("\0a\0\0"s), "\0a\0\0"s, 0},
        {ok(everyByte), everyByte, 0},
        {chunked, "a\0b\r\n"s, 0},
        {ok(""), "", 0},
        {noContent, "", 0},
        {ok("the ticket"), "the ticket", -7},
    };
    for (const auto& row : rows) {
        Server server({row.answer, noContent});
        std::vector<std::string> tickets;
        std::optional<Error> error;
        const bool paired =
            BWCPairCorvoWithProxy(server.url(), {}, &error, [&](const std::uint8_t* ticket, std::size_t length) {
                tickets.emplace_back(ticket, ticket + length);
                return row.result;
            });
        EXPECT_EQ(tickets, std::vector{row.ticket});
        EXPECT_EQ(paired, row.result == 0);
        EXPECT_EQ(error ? error->code : 0, row.result == 0 ? 0 : -1);
        EXPECT_EQ(server.requests(), (std::vector{"POST /corvo/pair HTTP/1.1: "s,
                                                  "POST /corvo/pair/result HTTP/1.1: " + std::to_string(row.result)}));
    }
}

TEST(Pairing, withoutAWholeTicketNothingIsLoaded) {
    const std::pair<std::string, std::int64_t> rows[] = {
        {"HTTP/1.1 404 Not Found\r\nConnection: close\r\nContent-Length: 1\r\n\r\nx", 404},
        {"HTTP/1.1 200 OK\r\nConnection: close\r\nContent-Length: 5\r\n\r\nhalf", 18}, // libcurl's CURLE_PARTIAL_FILE
    };
    for (const auto& [answer, code] : rows) {
        Server server({answer});
        std::optional<Error> error;
        EXPECT_FALSE(BWCPairCorvoWithProxy(server.url(), {}, &error, [](const std::uint8_t*, std::size_t) {
            ADD_FAILURE();
            return 0;
        }));
        EXPECT_EQ(error->domain, "BWCErrorDomain");
        EXPECT_EQ(error->code, code);
        EXPECT_EQ(server.requests().size(), 1U);
    }
}

} // namespace
