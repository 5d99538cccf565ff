// SPDX-License-Identifier: MIT
/* A word counter and a small agenda on red-black trees in the process heap.
 *
 * The string tree keeps one node per occurrence (equal keys stay in the
 * order they arrived), so the equal run of a word, found with the two bound
 * searches, is its count. The integer tree keeps agenda items by hour. */
#include <coffer/rbt.h>

#include <stdio.h>
#include <string.h>

static int released;

static void CountRelease(CofferVal val) {
  (void)val;
  released++;
}

static const char *KeyOf(RbtTree *tree, const RbtNode *node) {
  /* A string key is a pool offset; on the process heap the base is 0. */
  return (const char *)((uintptr_t)tree->mp.base + node->key);
}

static int CountRun(RbtTree *tree, const char *word) {
  int n = 0;
  RbtNode *end = RBT_UpperBound(tree, word);
  for (RbtNode *node = RBT_LowerBound(tree, word); node != end; node = RBT_Next(tree, node)) n++;
  return n;
}

int main(void) {
  static const char text[] = "the quick brown fox jumps over the lazy dog the end";
  char buf[sizeof text];
  memcpy(buf, text, sizeof text);

  RbtTree *words = RBT_AllocTree();
  if (!words) return 1;
  RBT_SetFreeValFn(words, CountRelease);
  int position = 0;
  for (char *w = strtok(buf, " "); w; w = strtok(NULL, " ")) RBT_Insert(words, w, position++);
  printf("inserted %d words\n", (int)RBT_GetSize(words));

  printf("distinct words in order:");
  for (RbtNode *node = RBT_First(words); node; node = RBT_UpperBound(words, KeyOf(words, node)))
    printf(" %s(%d)", KeyOf(words, node), CountRun(words, KeyOf(words, node)));
  printf("\n");

  RbtNode *the = RBT_LowerBound(words, "the");
  printf("first \"the\" is word #%u\n", (unsigned)the->val);
  RBT_RemoveRange(words, the, RBT_UpperBound(words, "the"));
  printf("removed every \"the\": %d values released, %d words left\n", released,
         (int)RBT_GetSize(words));
  printf("last word in order: %s\n", KeyOf(words, RBT_Prev(words, NULL)));
  RBT_FreeTree(words);
  printf("freed the word tree: %d values released in all\n", released);

  RbtTree *agenda = RbtInt32_AllocTree();
  if (!agenda) return 1;
  RbtInt32_Insert(agenda, 14, (CofferVal) "review");
  RbtInt32_Insert(agenda, 9, (CofferVal) "standup");
  RbtInt32_Insert(agenda, 12, (CofferVal) "lunch");
  RbtInt32_Insert(agenda, 9, (CofferVal) "coffee");
  RbtNode *next = RbtInt32_LowerBound(agenda, 10);
  printf("next item at or after 10h: %dh %s\n", (int)(int32_t)next->key, (const char *)next->val);
  printf("agenda:");
  for (RbtNode *node = RbtInt32_First(agenda); node; node = RbtInt32_Next(agenda, node))
    printf(" %dh %s;", (int)(int32_t)node->key, (const char *)node->val);
  printf("\n");
  RbtInt32_FreeTree(agenda);
  return 0;
}
