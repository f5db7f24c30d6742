#include "tavo_osal/list.h"

void tavo_osal_init_list_head(TAVO_ListNode* pHead) {
    pHead->next = pHead;
    pHead->prev = pHead;
}

void tavo_osal_list_insert(TAVO_ListNode* pNew, TAVO_ListNode* pPrev, TAVO_ListNode* pNext) {
    pNext->prev = pNew;
    pNew->next = pNext;
    pNew->prev = pPrev;
    pPrev->next = pNew;
}

void tavo_osal_list_add(TAVO_ListNode* pNew, TAVO_ListNode* pHead) { tavo_osal_list_insert(pNew, pHead, pHead->next); }

void tavo_osal_add_to_queue(TAVO_ListNode* pNew, TAVO_ListNode* pHead) {
    tavo_osal_list_insert(pNew, pHead->prev, pHead);
}

void tavo_osal_list_delete(TAVO_ListNode* pNode) {
    pNode->next->prev = pNode->prev;
    pNode->prev->next = pNode->next;
    pNode->next = nullptr;
    pNode->prev = nullptr;
}

int tavo_osal_is_list_empty(const TAVO_ListNode* pHead) { return pHead->next == pHead ? 1 : 0; }

TAVO_ListNode* tavo_osal_remove_from_queue(TAVO_ListNode* pHead) {
    if (tavo_osal_is_list_empty(pHead) != 0) return nullptr;
    TAVO_ListNode* first = pHead->next;
    tavo_osal_list_delete(first);
    return first;
}
