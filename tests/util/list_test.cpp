#include "tavo_osal/list.h"

#include <gtest/gtest.h>

#include <cstddef>
#include <vector>

#include "support/log_capture.h"

namespace {

// An element as callers make them, its link somewhere inside.
struct Element {
    int value;
    TAVO_ListNode link;
};

Element* element_of(TAVO_ListNode* node) {
    return reinterpret_cast<Element*>(reinterpret_cast<char*>(node) - offsetof(Element, link));
}

class List : public testing::Test {
protected:
    List() { tavo_osal_init_list_head(&head); }

    // The elements from front to back; checks the ring's invariant in both directions on the way.
    std::vector<int> contents() {
        std::vector<int> values;
        for (TAVO_ListNode* node = head.next; node != &head; node = node->next) {
            EXPECT_EQ(node->next->prev, node);
            EXPECT_EQ(node->prev->next, node);
            values.push_back(element_of(node)->value);
        }
        EXPECT_EQ(head.next->prev, &head);
        EXPECT_EQ(head.prev->next, &head);
        return values;
    }

    TAVO_ListNode head = {nullptr, nullptr};
    Element a = {1, {nullptr, nullptr}};
    Element b = {2, {nullptr, nullptr}};
    Element c = {3, {nullptr, nullptr}};
};

TEST_F(List, KeepsNextBeforePrevious) {
    EXPECT_EQ(offsetof(TAVO_ListNode, next), 0U);
    EXPECT_EQ(offsetof(TAVO_ListNode, prev), sizeof(void*));
    EXPECT_EQ(sizeof(TAVO_ListNode), 2 * sizeof(void*));
}

TEST_F(List, StartsEmptyWithAHeadThatPointsToItself) {
    EXPECT_EQ(head.next, &head);
    EXPECT_EQ(head.prev, &head);
    EXPECT_EQ(tavo_osal_is_list_empty(&head), 1);
}

TEST_F(List, InsertsBetweenTwoNeighbours) {
    tavo_osal_list_add(&a.link, &head);
    tavo_osal_add_to_queue(&c.link, &head);
    tavo_osal_list_insert(&b.link, &a.link, &c.link);
    EXPECT_EQ(contents(), (std::vector<int>{1, 2, 3}));
    EXPECT_EQ(tavo_osal_is_list_empty(&head), 0);
}

// Seen only where the nodes are not three different ones.
TEST_F(List, WritesTheLinksInTheirDocumentedOrder) {
    tavo_osal_list_insert(&b.link, &a.link, &b.link);
    EXPECT_EQ(b.link.next, &b.link);
    EXPECT_EQ(b.link.prev, &a.link);
    EXPECT_EQ(a.link.next, &b.link);

    tavo_osal_list_insert(&a.link, &a.link, &c.link);
    EXPECT_EQ(c.link.prev, &a.link);
    EXPECT_EQ(a.link.next, &a.link);
    EXPECT_EQ(a.link.prev, &a.link);
}

TEST_F(List, AddsAtTheFront) {
    tavo_osal_list_add(&a.link, &head);
    tavo_osal_list_add(&b.link, &head);
    tavo_osal_list_add(&c.link, &head);
    EXPECT_EQ(contents(), (std::vector<int>{3, 2, 1}));
    EXPECT_EQ(tavo_osal_remove_from_queue(&head), &c.link);
    EXPECT_EQ(tavo_osal_remove_from_queue(&head), &b.link);
    EXPECT_EQ(tavo_osal_remove_from_queue(&head), &a.link);
    EXPECT_EQ(tavo_osal_is_list_empty(&head), 1);
}

TEST_F(List, QueuesAtTheBack) {
    tavo_osal_add_to_queue(&a.link, &head);
    tavo_osal_add_to_queue(&b.link, &head);
    EXPECT_EQ(contents(), (std::vector<int>{1, 2}));
    EXPECT_EQ(tavo_osal_remove_from_queue(&head), &a.link);
    EXPECT_EQ(contents(), (std::vector<int>{2}));
    EXPECT_EQ(tavo_osal_remove_from_queue(&head), &b.link);
    EXPECT_EQ(contents(), (std::vector<int>{}));
}

TEST_F(List, UnlinksADeletedNodeAndClearsItsPointers) {
    for (Element* element : {&a, &b, &c}) tavo_osal_add_to_queue(&element->link, &head);
    tavo_osal_list_delete(&b.link);
    EXPECT_EQ(b.link.next, nullptr);
    EXPECT_EQ(b.link.prev, nullptr);
    EXPECT_EQ(contents(), (std::vector<int>{1, 3}));
    tavo_osal_list_delete(&a.link);
    tavo_osal_list_delete(&c.link);
    EXPECT_EQ(tavo_osal_is_list_empty(&head), 1);
}

TEST_F(List, ClearsThePointersOfARemovedNodeWhichMayBeAddedAgain) {
    tavo_osal_add_to_queue(&a.link, &head);
    TAVO_ListNode* removed = tavo_osal_remove_from_queue(&head);
    ASSERT_EQ(removed, &a.link);
    EXPECT_EQ(removed->next, nullptr);
    EXPECT_EQ(removed->prev, nullptr);
    tavo_osal_list_add(removed, &head);
    EXPECT_EQ(contents(), (std::vector<int>{1}));
}

TEST_F(List, AnswersNullFromAnEmptyQueueAndLeavesTheHead) {
    EXPECT_EQ(tavo_osal_remove_from_queue(&head), nullptr);
    EXPECT_EQ(head.next, &head);
    EXPECT_EQ(head.prev, &head);
}

TEST_F(List, TellsOfAnElementWhetherItPointsToItself) {
    tavo_osal_add_to_queue(&a.link, &head);
    EXPECT_EQ(tavo_osal_is_list_empty(&a.link), 0);
    a.link.next = &a.link;
    EXPECT_EQ(tavo_osal_is_list_empty(&a.link), 1);
}

TEST_F(List, LogsNothing) {
    const tavo::test::LogCapture log;
    tavo_osal_add_to_queue(&a.link, &head);
    tavo_osal_remove_from_queue(&head);
    tavo_osal_remove_from_queue(&head);
    EXPECT_TRUE(log.lines().empty());
}

}  // namespace
