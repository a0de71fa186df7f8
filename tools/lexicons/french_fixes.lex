# French words whose records replace Lefff's, written for this project (mkbdb's lexicon
# format). Lefff leaves out the contractions of a preposition and an article, which it
# reads as two words, and gives the partitive and indefinite "de", "des" the base form
# "un"; here they keep their determiner first (the analysis builds nominal groups with
# it: "pas de thé", "des pommes") with the base form "de", as lemmatisers give it.
de	determinant=de	preposition=de
des	determinant/p=de	preposition=de
du	determinant/ms=de	preposition=de
au	preposition=à	determinant/ms=le
aux	preposition=à	determinant/p=le
# Subject pronouns in the plural: Lefff gives no base form; lemmatisers give the singular.
ils	pronoun/3mp=il
elles	pronoun/3fp=elle
# The oven, spelt as the English "four": no base form, so that the gesture of four
# items is not called for by it.
four	noun/ms
