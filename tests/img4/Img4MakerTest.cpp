// The maker's files are DER to another reader too.
#include "tools/makers/Img4Maker.h"
#include "tests/support/OpenSSLTool.h"

#include <string>

#include <gtest/gtest.h>

namespace {

TEST(Img4Maker, openSSLReadsWhatItMakes) {
    const std::string ticket = asn1parse(img4maker::exampleTicket());
    EXPECT_NE(ticket.find("IA5STRING         :IM4M"), std::string::npos) << ticket;
    EXPECT_NE(ticket.find("IA5STRING         :eksp"), std::string::npos);
    EXPECT_NE(ticket.find("priv [ " + std::to_string(img4maker::fourCC("sepi")) + " ]"), std::string::npos);

    const std::string container = asn1parse(img4maker::exampleContainer());
    EXPECT_NE(container.find("IA5STRING         :IMG4"), std::string::npos) << container;
    EXPECT_NE(container.find("IA5STRING         :PAYP"), std::string::npos);
    EXPECT_NE(container.find("IA5STRING         :IM4R"), std::string::npos);
    EXPECT_NE(container.find("INTEGER           :0100000000"), std::string::npos);
}

} // namespace
