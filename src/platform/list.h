// Intrusive doubly linked list. A head is a list_head linked to itself when empty; an element that
// is on no list is linked to itself as well, so unlinking twice is harmless.
#pragma once

namespace VELK {

// The head of a list, or the link inside an element of one. Owns nothing.
struct list_head {
    list_head* next;  // the first element, in a head
    list_head* prev;  // the last element, in a head

    // Links it to itself: an empty list, or an element on no list. REQUIRED before anything else.
    void Init() {
        next = this;
        prev = this;
    }
    // Of a head: nothing is on the list. Of an element: it is on none.
    bool IsEmpty() const { return next == this; }

    // Unlinks this element and links it to itself.
    void Unlink() {
        prev->next = next;
        next->prev = prev;
        Init();
    }

    // Links this element (on no list) in front of `head`, which makes it the last one.
    void LinkTail(list_head* head) {
        next = head;
        prev = head->prev;
        head->prev->next = this;
        head->prev = this;
    }

    // Moves this element, listed or not, to the tail of `head`.
    void MoveTail(list_head* head) {
        Unlink();
        LinkTail(head);
    }
};

}  // namespace VELK
