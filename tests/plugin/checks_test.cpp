#include "plugin/plugin.h"

namespace {

struct Case {
  const char* params;
  const char* verdict;
};

void Judge(const std::string& method, std::initializer_list<Case> cases) {
  for (const Case& one : cases) {
    EXPECT_EQ(Check(method, FromText(one.params)), one.verdict) << method << " " << one.params;
  }
}

TEST(Checks, Search) {
  Judge("search",
        {{"{}", "search_weight_list required"},
         {"{'search_weight_list':[]}", "accepted"},
         {"{'search_weight_list':{}}", "search_weight_list type"},
         {"{'search_weight_list':[{'weight':1,'field':'a'},{'weight':0.5}]}", "accepted"},
         {"{'search_weight_list':[{'weight':'1','field':'a'}]}", "search_weight_list type"},
         {"{'search_weight_list':[{'weight':1,'field':2}]}", "search_weight_list type"},
         {"{'search_weight_list':[5]}", "search_weight_list type"},
         {"{'search_weight_list':[],'criteria_list':[{'field':'x'}]}", "accepted"},
         {"{'search_weight_list':[],'criteria_list':[{'field':'x','value':1}]}",
          "criteria_list type"},
         {"{'search_weight_list':[],'highlight':[{'field':'x','frag_length':1.5}]}",
          "highlight type"},
         {"{'search_weight_list':[],'highlight':[{'num_fragments':3000000000}]}", "highlight type"},
         {"{'search_weight_list':[],'size':'5'}", "size type"},
         {"{'search_weight_list':[],'size':-5,'from':-1}", "accepted"},
         {"{'search_weight_list':[],'from':null}", "from type"},
         {"{'search_weight_list':[],'fields':['a',1]}", "fields type"},
         {"{'search_weight_list':[],'indice':[[]]}", "indice type"}});
  // The types of all parameters come before the elements of any, each in its own order.
  Judge("search",
        {{"{'search_weight_list':[],'keyword':1,'criteria_list':[1]}", "keyword type"},
         {"{'search_weight_list':1,'criteria_list':1,'keyword':1}", "search_weight_list type"},
         {"{'search_weight_list':[1],'indice':'x'}", "indice type"},
         {"{'search_weight_list':[],'indice':[1],'fields':[1],'highlight':[1]}", "highlight type"},
         {"{'search_weight_list':[],'file_type':1,'fields':1,'size':'','from':''}",
          "file_type type"}});
}

TEST(Checks, Highlight) {
  Judge("highlight",
        {{"{}", "full_path required"},
         {"{'full_path':'/','highlight':{},'keyword':''}", "doc_id required"},
         {"{'full_path':'/','doc_id':'1','keyword':1}", "doc_id type"},
         {"{'full_path':'/','doc_id':1,'highlight':[],'keyword':1}", "highlight type"},
         {"{'full_path':'/','doc_id':1,'highlight':{}}", "keyword required"},
         {"{'full_path':'/','doc_id':1,'highlight':{},'keyword':''}", "accepted"},
         {"{'full_path':'/','doc_id':1,'highlight':{'num_fragments':'3'},'keyword':''}",
          "highlight type"}});
}

TEST(Checks, TermsIndicateAndBoost) {
  Judge("suggest", {{"{}", "terms required"},
                    {"{'terms':'a'}", "accepted"},
                    {"{'terms':1,'suggester':'x'}", "suggester type"},
                    {"{'terms':1,'indice':'x'}", "indice type"},
                    {"{'terms':'a','suggest_num':'2','suggester':[1]}", "suggest_num type"},
                    {"{'terms':'a','suggester':['x',1],'indice':[1]}", "suggester type"},
                    {"{'terms':'a','indice':[1]}", "indice type"}});
  Judge("list_avail_db",
        {{"{}", "accepted"}, {"{'anything':[1]}", "accepted"}, {"[]", "accepted"}});
  Judge("indicate",
        {{"{}", "search_weight_list required"},
         {"{'search_weight_list':[],'keyword':1}", "criteria_list required"},
         {"{'search_weight_list':[],'criteria_list':[],'keyword':1}", "keyword type"},
         {"{'search_weight_list':[],'criteria_list':[],'keyword':''}", "file_type required"},
         {"{'search_weight_list':[1],'criteria_list':[1],'keyword':'','file_type':[1]}",
          "criteria_list type"},
         {"{'search_weight_list':[1],'criteria_list':[],'keyword':'','file_type':[1]}",
          "search_weight_list type"},
         {"{'search_weight_list':[],'criteria_list':[],'keyword':'','file_type':[1]}",
          "file_type type"},
         {"{'search_weight_list':[],'criteria_list':[],'keyword':'','file_type':['a']}",
          "accepted"}});
  Judge("boost", {{"{}", "full_path required"},
                  {"{'full_path':null}", "full_path type"},
                  {"{'full_path':''}", "accepted"}});
}

TEST(Checks, History) {
  Judge("get", {{"{}", "accepted"},
                {"{'limit':-1,'offset':-1}", "accepted"},
                {"{'sort_direction':1,'sort_by':1}", "sort_direction type"},
                {"{'substr':1,'offset':'','limit':'','sort_by':1}", "sort_by type"},
                {"{'substr':1,'offset':'','limit':''}", "limit type"},
                {"{'substr':1,'offset':1.5}", "offset type"},
                {"{'substr':[]}", "substr type"}});
  Judge("delete", {{"{}", "id required"},
                   {"{'id':3}", "id type"},
                   {"{'id':[1.5]}", "id type"},
                   {"{'id':['3']}", "id type"},
                   {"{'id':[1,null]}", "id type"},
                   {"{'id':[]}", "accepted"},
                   {"{'id':[1.0,3000000000]}", "accepted"}});
}

}  // namespace
