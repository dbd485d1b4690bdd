/*
 * Record lists: the intrusive, circular, doubly linked queue that every list of records
 * (LUNs, targets, mappings, snapshots, ...) is made of.
 *
 * An element is one heap block, allocated zeroed: the record first, its link right after
 * it.  A list is a count and a head link; an empty list's head points at itself.  New
 * elements are appended at the tail with insque(3), so a list keeps the order in which its
 * loader met the records; elements leave it with remque(3).  The function that loads a list
 * allocates every element; the holder frees them with the list's free function (or with
 * ORLOiSCSIListFree and the offset of the link inside the element).
 *
 * A list must not be copied by value once it has been initialised: the first and last
 * elements point back at the head.  A zero-filled list counts as not yet initialised and is
 * initialised by the loaders and by ORLOiSCSIListAppend.
 *
 * Threads: a list belongs to one thread at a time; nothing here takes a lock.
 */
#ifndef ORLOISCSI_LIST_H
#define ORLOISCSI_LIST_H

#include <search.h>
#include <stddef.h>
#include <stdint.h>
#include <stdlib.h>

/* The two pointers that chain an element (the layout insque/remque expect). */
typedef struct _tag_ORLO_ISCSI_LIST_LINK {
    struct _tag_ORLO_ISCSI_LIST_LINK *next;
    struct _tag_ORLO_ISCSI_LIST_LINK *prev;
} ORLOiSCSIListLink;

/* A list: how many elements it holds, and the head of the circular queue. */
typedef struct _tag_ORLO_ISCSI_LIST {
    int32_t count;
    ORLOiSCSIListLink head;
} ORLOiSCSIList;

/* The element that holds a link, from the link: the element's type and the link's member. */
#define ORLO_ISCSI_LIST_ENTRY(linkPtr, type, member) \
    ((type *)(void *)((char *)(linkPtr) - offsetof(type, member)))

/* Walks every link of a list from the first element to the last.  The body must not remove
 * the current element; use ORLO_ISCSI_LIST_FOREACH_SAFE for that. */
#define ORLO_ISCSI_LIST_FOREACH(listPtr, linkVar) \
    for ((linkVar) = (listPtr)->head.next; (linkVar) != &(listPtr)->head; (linkVar) = (linkVar)->next)

/* The same walk, tolerating removal of the current element (nextVar holds the next one). */
#define ORLO_ISCSI_LIST_FOREACH_SAFE(listPtr, linkVar, nextVar)                            \
    for ((linkVar) = (listPtr)->head.next, (nextVar) = (linkVar)->next;                     \
         (linkVar) != &(listPtr)->head; (linkVar) = (nextVar), (nextVar) = (linkVar)->next)

/* Makes a list empty without freeing anything (for a list that was never filled). */
static inline void ORLOiSCSIListInit(ORLOiSCSIList *list) {
    list->count = 0;
    list->head.next = &list->head;
    list->head.prev = &list->head;
}

/* True when the list has been initialised (a zero-filled list has not). */
static inline int ORLOiSCSIListIsInit(const ORLOiSCSIList *list) {
    return list->head.next != NULL && list->head.prev != NULL;
}

/* Appends the element whose link is given at the tail and counts it. */
static inline void ORLOiSCSIListAppend(ORLOiSCSIList *list, ORLOiSCSIListLink *link) {
    if (!ORLOiSCSIListIsInit(list)) ORLOiSCSIListInit(list);
    insque(link, list->head.prev);
    list->count++;
}

/* Takes an element out of its list (the caller frees it). */
static inline void ORLOiSCSIListRemove(ORLOiSCSIList *list, ORLOiSCSIListLink *link) {
    remque(link);
    link->next = link->prev = NULL;
    if (list->count > 0) list->count--;
}

/* The first link, or NULL for an empty list. */
static inline ORLOiSCSIListLink *ORLOiSCSIListFirst(const ORLOiSCSIList *list) {
    if (!ORLOiSCSIListIsInit(list) || list->head.next == &list->head) return NULL;
    return list->head.next;
}

/* Removes and frees every element (each one heap block with its link linkOffset bytes from
 * its start) and leaves the list empty and initialised.  A NULL or zero-filled list is
 * only initialised. */
static inline void ORLOiSCSIListFree(ORLOiSCSIList *list, size_t linkOffset) {
    if (list == NULL) return;
    if (ORLOiSCSIListIsInit(list)) {
        while (list->head.next != &list->head) {
            ORLOiSCSIListLink *link = list->head.next;
            remque(link);
            free((char *)link - linkOffset);
        }
    }
    ORLOiSCSIListInit(list);
}

#endif
