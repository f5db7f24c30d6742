/**
 * @file
 * Intrusive circular doubly linked lists, usable as lists and as FIFO queues.
 *
 * The caller embeds a ::TAVO_ListNode in its own record and keeps one more node as the list's head, a
 * sentinel that is never an element. In every ring n.next.prev = n and n.prev.next = n. No function
 * allocates, frees, locks, logs or checks; the caller owns every node and serialises access.
 */
#ifndef TAVO_OSAL_LIST_H
#define TAVO_OSAL_LIST_H

#include "tavo_osal/export.h"

TAVO_BEGIN_DECLS

/** A link. In an empty list both pointers of the head are the head itself; both pointers of a node that
 *  was deleted are null. */
typedef struct TAVO_ListNode {
    struct TAVO_ListNode* next; /**< the following node */
    struct TAVO_ListNode* prev; /**< the preceding node */
} TAVO_ListNode;

/** Makes pHead the head of an empty list. */
TAVO_API void tavo_osal_init_list_head(TAVO_ListNode* pHead);

/** Links pNew between the adjacent nodes pPrev and pNext. */
TAVO_API void tavo_osal_list_insert(TAVO_ListNode* pNew, TAVO_ListNode* pPrev, TAVO_ListNode* pNext);

/** Inserts pNew at the front, right after pHead: last in, first out. */
TAVO_API void tavo_osal_list_add(TAVO_ListNode* pNew, TAVO_ListNode* pHead);

/** Inserts pNew at the back, right before pHead: first in, first out. */
TAVO_API void tavo_osal_add_to_queue(TAVO_ListNode* pNew, TAVO_ListNode* pHead);

/** Unlinks pNode and sets both of its pointers to null. A node must not be deleted twice: it is not checked. */
TAVO_API void tavo_osal_list_delete(TAVO_ListNode* pNode);

/** @return 1 when pHead's next node is pHead itself, else 0; meaningful on a head only */
TAVO_API int tavo_osal_is_list_empty(const TAVO_ListNode* pHead);

/** Unlinks the first node. @return the node, or null (and pHead unchanged) when the list is empty */
TAVO_API TAVO_ListNode* tavo_osal_remove_from_queue(TAVO_ListNode* pHead);

TAVO_END_DECLS

#endif
