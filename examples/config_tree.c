// SPDX-License-Identifier: MIT
/* A configuration tree with array templates. "/servers/#" is the template of
 * the server array: an element such as "/servers/#1" is made as a copy of it
 * on first use, a setting made through the template reaches every element
 * that exists, and an element that holds nothing beyond the template is
 * dropped again. Values here are plain numbers (ports, weights, seconds). */
#include <coffer/hstaa.h>
#include <stdio.h>
#include <string.h>

/* A setting replaces what the node held; clearing one must name the value. */
static bool set_value(HstaaTree *tree, CofferVal cur, CofferVal val, CofferVal *out) {
  (void)tree;
  (void)cur;
  *out = val;
  return true;
}

static bool clear_value(HstaaTree *tree, CofferVal cur, CofferVal val, CofferVal *out) {
  (void)tree;
  if (cur != val) return false;
  *out = 0;
  return true;
}

static bool copy_value(HstTree *tree, CofferVal val, CofferVal *out) {
  (void)tree;
  *out = val;
  return true;
}

static void show_node(HstaaTree *t, HstNode *node, int depth) {
  int32_t i;
  if (depth > 0)
    printf("  %*s%s = %u  (%d value%s below)\n", 2 * (depth - 1), "", HST_GetKey(&t->hst, node),
           (unsigned)HST_GetVal(&t->hst, node), (int)HSTAA_GetSubtreeValCount(t, node),
           HSTAA_GetSubtreeValCount(t, node) == 1 ? "" : "s");
  for (i = 0; i < HST_GetNumChildren(&t->hst, node); i++)
    show_node(t, HST_GetChild(&t->hst, node, i), depth + 1);
}

static void show(HstaaTree *t) {
  printf("  tree (%d values, %d nodes):\n", (int)HSTAA_GetSubtreeValCount(t, HST_GetRoot(&t->hst)),
         (int)HST_GetSize(&t->hst));
  show_node(t, HST_GetRoot(&t->hst), 0);
}

static void set(HstaaTree *t, const char *path, CofferVal val) {
  printf("set %s = %u: %s\n", path, (unsigned)val, HSTAA_Insert(t, path, val) ? "ok" : "failed");
}

static void clear(HstaaTree *t, const char *path, CofferVal val) {
  printf("clear %s = %u\n", path, (unsigned)val);
  HSTAA_Remove(t, path, val);
}

static void lookup(HstaaTree *t, const char *path) {
  bool complete = false;
  HstNode *node = HSTAA_FindPrefix(t, path, &complete);
  const char *key = node ? HST_GetKey(&t->hst, node) : "?";
  if (node && complete)
    printf("lookup %s -> %u (found at node \"%s\")\n", path, (unsigned)HST_GetVal(&t->hst, node),
           key);
  else
    printf("lookup %s -> not set (stopped below %s)\n", path, *key ? key : "the root");
}

int main(void) {
  HstaaTree cfg;
  memset(&cfg, 0, sizeof cfg);
  MemPool_InitOnStdHeap(&cfg.hst.mp);
  cfg.cloneValFn = copy_value;
  cfg.insertValFn = set_value;
  cfg.removeValFn = clear_value;
  if (!HST_CreateTreeData(&cfg.hst, '/', 0, 4, 4)) return 1;

  printf("-- a template for every server\n");
  set(&cfg, "/servers/#/port", 8080);
  set(&cfg, "/servers/#/timeout", 30);
  show(&cfg);

  printf("-- two servers, each made as a copy of the template\n");
  set(&cfg, "/servers/#1/weight", 5);
  set(&cfg, "/servers/#2/weight", 3);
  set(&cfg, "/servers/#2/port", 9090);
  printf("  (#2's port now counts two settings: the copied 8080 and its own 9090)\n");
  show(&cfg);

  printf("-- a setting made through the template reaches both servers\n");
  set(&cfg, "/servers/#/retries", 4);
  show(&cfg);

  printf("-- servers without a node of their own read the template\n");
  lookup(&cfg, "/servers/#1/port");
  lookup(&cfg, "/servers/#2/port");
  lookup(&cfg, "/servers/#7/port");
  lookup(&cfg, "/servers/#7/weight");
  lookup(&cfg, "/clients/#1/port");

  printf("-- clearing through the template clears every server first\n");
  clear(&cfg, "/servers/#/retries", 4);
  show(&cfg);

  printf("-- #1 without its weight holds no more than the template: it goes\n");
  clear(&cfg, "/servers/#1/weight", 5);
  show(&cfg);

  printf("-- #2 keeps what differs from the template\n");
  clear(&cfg, "/servers/#/timeout", 30);
  clear(&cfg, "/servers/#/port", 8080);
  show(&cfg);

  HST_FreeTree(&cfg.hst);
  return 0;
}
