// String lists and hashes: growth past the first capacity, insertion order, sorted
// lookups, refusals that never cut, and allocation failures that leave the container
// as it was.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "olibc.h"
#include "platform/olibc_mem.h"

namespace {

TEST(SzList, GrowsPastItsCapacityAndKeepsOrder) {
    POLIBC_SZLIST list = OLIBCSzListAlloc(1);
    ASSERT_NE(nullptr, list);
    for (int i = 0; i < 1000; ++i) ASSERT_EQ(i, OLIBCSzListPush(&list, ("LUN_" + std::to_string(i)).c_str()));
    EXPECT_EQ(1000, OLIBCSzListCount(list));
    EXPECT_GE(list->nAlloc, 1000);
    for (int i = 0; i < 1000; ++i) EXPECT_EQ("LUN_" + std::to_string(i), OLIBCSzListGet(list, i));
    EXPECT_EQ(nullptr, OLIBCSzListGet(list, 1000));
    EXPECT_EQ(nullptr, OLIBCSzListGet(list, -1));
    EXPECT_EQ(999, OLIBCSzListFind(list, "LUN_999"));
    EXPECT_EQ(-1, OLIBCSzListFind(list, "LUN_1000"));
    OLIBCSzListRemoveAll(list);
    EXPECT_EQ(0, OLIBCSzListCount(list));
    EXPECT_EQ(0, OLIBCSzListPush(&list, "again"));
    OLIBCSzListFree(list);
    OLIBCSzListFree(nullptr);
}

TEST(SzList, SortsBothWaysAndFindsByBinarySearch) {
    POLIBC_SZLIST list = OLIBCSzListAlloc(4);
    for (const char *s : {"iSCSI_T2", "LUN_b", "LUN_a", "iSCSI_MAP_T1_L3", "LUN_c", "A"}) OLIBCSzListPush(&list, s);
    ASSERT_EQ(0, OLIBCSzListSortItems(list, 0));
    std::vector<std::string> got;
    for (int i = 0; i < list->nItem; ++i) got.emplace_back(OLIBCSzListGet(list, i));
    EXPECT_EQ((std::vector<std::string>{"A", "LUN_a", "LUN_b", "LUN_c", "iSCSI_MAP_T1_L3", "iSCSI_T2"}), got);
    for (int i = 0; i < list->nItem; ++i) EXPECT_EQ(i, OLIBCSzListBinaryFind(list, OLIBCSzListGet(list, i)));
    EXPECT_EQ(-1, OLIBCSzListBinaryFind(list, "LUN_"));
    EXPECT_EQ(-1, OLIBCSzListBinaryFind(list, "z"));
    ASSERT_EQ(0, OLIBCSzListSortItems(list, 1));
    EXPECT_STREQ("iSCSI_T2", OLIBCSzListGet(list, 0));
    EXPECT_STREQ("A", OLIBCSzListGet(list, 5));
    OLIBCSzListFree(list);
}

TEST(SzList, JoinAndPopRefuseRatherThanCut) {
    POLIBC_SZLIST list = OLIBCSzListAlloc(2);
    char buf[16];
    EXPECT_EQ(0, OLIBCSzListJoin(list, ",", buf, sizeof(buf)));
    EXPECT_STREQ("", buf);
    for (const char *s : {"abc", "de", "f"}) OLIBCSzListPush(&list, s);
    EXPECT_EQ(10, OLIBCSzListJoin(list, ", ", buf, sizeof(buf)));
    EXPECT_STREQ("abc, de, f", buf);
    EXPECT_EQ(6, OLIBCSzListJoin(list, nullptr, buf, sizeof(buf)));
    EXPECT_STREQ("abcdef", buf);
    char small[8];  // "abc, de, f" needs 11
    EXPECT_EQ(-1, OLIBCSzListJoin(list, ", ", small, sizeof(small)));
    EXPECT_EQ(OLIBC_ERR_TOO_LONG, OLIBCErrGet());
    EXPECT_STREQ("", small);
    char one[1];
    EXPECT_EQ(-1, OLIBCSzListPop(list, one, sizeof(one)));  // "f" needs 2 bytes
    EXPECT_EQ(3, OLIBCSzListCount(list));
    EXPECT_EQ(0, OLIBCSzListPop(list, buf, sizeof(buf)));
    EXPECT_STREQ("f", buf);
    EXPECT_EQ(0, OLIBCSzListPop(list, nullptr, 0));
    EXPECT_EQ(0, OLIBCSzListPop(list, buf, sizeof(buf)));
    EXPECT_STREQ("abc", buf);
    EXPECT_EQ(-1, OLIBCSzListPop(list, buf, sizeof(buf)));
    EXPECT_EQ(OLIBC_ERR_NOT_FOUND, OLIBCErrGet());
    OLIBCSzListFree(list);
}

TEST(SzList, BadArgumentsAndAllocationFailures) {
    EXPECT_EQ(nullptr, OLIBCSzListAlloc(-1));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
    EXPECT_EQ(-1, OLIBCSzListPush(nullptr, "x"));
    EXPECT_EQ(-1, OLIBCSzListCount(nullptr));
    orlo::olibc::FailAllocationIn(1);
    EXPECT_EQ(nullptr, OLIBCSzListAlloc(8));
    EXPECT_EQ(OLIBC_ERR_OUT_OF_MEM, OLIBCErrGet());
    orlo::olibc::FailAllocationIn(2);  // the item array
    EXPECT_EQ(nullptr, OLIBCSzListAlloc(8));

    POLIBC_SZLIST list = OLIBCSzListAlloc(4);
    for (const char *s : {"a", "b", "c", "d"}) OLIBCSzListPush(&list, s);
    orlo::olibc::FailAllocationIn(1);  // growing the array
    EXPECT_EQ(-1, OLIBCSzListPush(&list, "e"));
    EXPECT_EQ(OLIBC_ERR_OUT_OF_MEM, OLIBCErrGet());
    orlo::olibc::FailAllocationIn(2);  // copying the string after growing
    EXPECT_EQ(-1, OLIBCSzListPush(&list, "e"));
    EXPECT_EQ(4, OLIBCSzListCount(list));
    EXPECT_STREQ("d", OLIBCSzListGet(list, 3));
    EXPECT_EQ(4, OLIBCSzListPush(&list, "e"));
    OLIBCSzListFree(list);
}

std::vector<std::pair<std::string, std::string>> Pairs(const OLIBC_SZHASH *h) {
    std::vector<std::pair<std::string, std::string>> out;
    const char *k = nullptr;
    const char *v = nullptr;
    for (int i = 0; OLIBCSzHashEnum(h, i, &k, &v); ++i) out.emplace_back(k, v);
    return out;
}

TEST(SzHash, IteratesInInsertionOrderThroughGrowthReplacementAndRemoval) {
    POLIBC_SZHASH h = OLIBCSzHashAlloc(1);
    ASSERT_NE(nullptr, h);
    for (int i = 0; i < 2000; ++i) {
        std::string k = "key" + std::to_string((i * 7919) % 2000);
        ASSERT_EQ(0, OLIBCSzHashSetValue(&h, k.c_str(), std::to_string(i).c_str()));
    }
    ASSERT_EQ(2000, OLIBCSzHashCount(h));
    auto pairs = Pairs(h);
    for (int i = 0; i < 2000; ++i) {
        EXPECT_EQ("key" + std::to_string((i * 7919) % 2000), pairs[i].first);
        EXPECT_EQ(std::to_string(i), pairs[i].second);
    }
    // Replacing keeps the pair's place; removing closes the gap and lookups still work.
    ASSERT_EQ(0, OLIBCSzHashSetValue(&h, pairs[5].first.c_str(), "replaced"));
    ASSERT_EQ(1, OLIBCSzHashRemove(h, pairs[3].first.c_str()));
    EXPECT_EQ(0, OLIBCSzHashRemove(h, pairs[3].first.c_str()));
    auto after = Pairs(h);
    ASSERT_EQ(1999u, after.size());
    EXPECT_EQ(pairs[4].first, after[3].first);
    EXPECT_EQ(pairs[5].first, after[4].first);
    EXPECT_EQ("replaced", after[4].second);
    EXPECT_EQ(nullptr, OLIBCSzHashGetValue(h, pairs[3].first.c_str()));
    for (int i = 0; i < 2000; ++i) {
        if (i == 3) continue;
        const char *v = OLIBCSzHashGetValue(h, pairs[i].first.c_str());
        ASSERT_NE(nullptr, v) << i;
        EXPECT_EQ(i == 5 ? std::string("replaced") : pairs[i].second, v);
    }
    OLIBCSzHashRemoveAll(h);
    EXPECT_EQ(0, OLIBCSzHashCount(h));
    EXPECT_EQ(nullptr, OLIBCSzHashGetValue(h, pairs[0].first.c_str()));
    EXPECT_EQ(0, OLIBCSzHashSetValue(&h, "", "empty key is a key"));
    EXPECT_STREQ("empty key is a key", OLIBCSzHashGetValue(h, ""));
    EXPECT_EQ(0, OLIBCSzHashEnum(h, 1, nullptr, nullptr));
    EXPECT_EQ(0, OLIBCSzHashEnum(h, -1, nullptr, nullptr));
    OLIBCSzHashFree(h);
}

TEST(SzHash, AllocationFailuresLeaveTheHashAsItWas) {
    orlo::olibc::FailAllocationIn(1);
    EXPECT_EQ(nullptr, OLIBCSzHashAlloc(16));
    EXPECT_EQ(OLIBC_ERR_OUT_OF_MEM, OLIBCErrGet());
    EXPECT_EQ(nullptr, OLIBCSzHashAlloc(-4));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());

    // Growing (index, then entries), the key copy, the value copy: each failure leaves
    // a full hash exactly as it was.
    POLIBC_SZHASH h = nullptr;
    for (int n = 1; n <= 4; ++n) {
        OLIBCSzHashFree(h);
        h = OLIBCSzHashAlloc(8);
        for (int i = 0; i < 8; ++i) OLIBCSzHashSetValue(&h, ("k" + std::to_string(i)).c_str(), "v");
        orlo::olibc::FailAllocationIn(n);
        EXPECT_EQ(-1, OLIBCSzHashSetValue(&h, "k8", "v8")) << n;
        EXPECT_EQ(OLIBC_ERR_OUT_OF_MEM, OLIBCErrGet());
        EXPECT_EQ(8, OLIBCSzHashCount(h));
        EXPECT_EQ(nullptr, OLIBCSzHashGetValue(h, "k8"));
        EXPECT_STREQ("v", OLIBCSzHashGetValue(h, "k7"));
    }
    orlo::olibc::FailAllocationIn(1);
    EXPECT_EQ(-1, OLIBCSzHashSetValue(&h, "k0", "new"));
    EXPECT_STREQ("v", OLIBCSzHashGetValue(h, "k0"));
    orlo::olibc::FailAllocationIn(0);
    EXPECT_EQ(0, OLIBCSzHashSetValue(&h, "k8", "v8"));
    EXPECT_EQ(9, OLIBCSzHashCount(h));
    EXPECT_EQ(-1, OLIBCSzHashSetValue(&h, nullptr, "v"));
    EXPECT_EQ(-1, OLIBCSzHashSetValue(&h, "k", nullptr));
    EXPECT_EQ(OLIBC_ERR_BAD_PARAM, OLIBCErrGet());
    OLIBCSzHashFree(h);
}

}  // namespace
