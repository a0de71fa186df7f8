# French emotion words, written for this project (mkbdb's lexicon format: the emotion
# label is the base form of a record of class "unkonwn"). They replace the polarity
# lexicon's label of the same word. A word is a base form of Lefff: its forms get the
# same label ("réussir" gives "réussi", "réussit", ...); a word written "=word" is that
# exact form only. The label "none" takes a word's label away.
#
# "ne" and "n'" are not negations here: they come with "pas", "jamais", "rien"..., and a
# negation counted twice would turn the emotion around again.
=pas	unkonwn=negation
=jamais	unkonwn=negation
=rien	unkonwn=negation
aucun	unkonwn=negation
=nullement	unkonwn=negation
=guère	unkonwn=negation
=ni	unkonwn=negation
=non	unkonwn=negation
=sans	unkonwn=negation
=personne	unkonwn=negation
# Intensifiers.
=très	unkonwn=strong adverb
=vraiment	unkonwn=strong adverb
=beaucoup	unkonwn=strong adverb
=trop	unkonwn=strong adverb
=tellement	unkonwn=strong adverb
=extrêmement	unkonwn=strong adverb
=incroyablement	unkonwn=strong adverb
=vachement	unkonwn=strong adverb
=absolument	unkonwn=strong adverb
=énormément	unkonwn=strong adverb
=profondément	unkonwn=strong adverb
# Praise, thanks, welcome, success, joy.
félicitations	unkonwn=very positive
=bravo	unkonwn=very positive
génial	unkonwn=very positive
excellent	unkonwn=very positive
parfait	unkonwn=very positive
=parfaitement	unkonwn=positive
magnifique	unkonwn=very positive
formidable	unkonwn=very positive
extraordinaire	unkonwn=very positive
merveilleux	unkonwn=very positive
fantastique	unkonwn=very positive
adorer	unkonwn=very positive
succès	unkonwn=positive
réussir	unkonwn=positive
réussite	unkonwn=positive
bienvenue	unkonwn=positive
bienvenu	unkonwn=positive
féliciter	unkonwn=positive
=merci	unkonwn=positive
remercier	unkonwn=positive
remerciement	unkonwn=positive
ravi	unkonwn=positive
ravir	unkonwn=positive
content	unkonwn=positive
heureux	unkonwn=positive
joie	unkonwn=positive
joyeux	unkonwn=positive
plaisir	unkonwn=positive
aimer	unkonwn=positive
super	unkonwn=positive
beau	unkonwn=positive
joli	unkonwn=positive
gentil	unkonwn=positive
agréable	unkonwn=positive
délicieux	unkonwn=positive
fier	unkonwn=positive
enchanté	unkonwn=positive
satisfait	unkonwn=positive
réjouir	unkonwn=positive
sourire	unkonwn=positive
rire	unkonwn=positive
gagner	unkonwn=positive
victoire	unkonwn=positive
brillant	unkonwn=positive
remarquable	unkonwn=positive
utile	unkonwn=positive
meilleur	unkonwn=positive
=mieux	unkonwn=positive
amuser	unkonwn=positive
calme	unkonwn=positive
détendu	unkonwn=positive
espoir	unkonwn=positive
amour	unkonwn=positive
# Failure, apology, sadness, anger, fear, pain.
échouer	unkonwn=negative
échec	unkonwn=negative
erreur	unkonwn=negative
problème	unkonwn=negative
panne	unkonwn=negative
désolé	unkonwn=negative
excuser	unkonwn=negative
excuse	unkonwn=negative
=pardon	unkonwn=negative
regretter	unkonwn=negative
regret	unkonwn=negative
=malheureusement	unkonwn=negative
=hélas	unkonwn=negative
=dommage	unkonwn=negative
triste	unkonwn=negative
tristesse	unkonwn=negative
colère	unkonwn=negative
fâché	unkonwn=negative
énerver	unkonwn=negative
détester	unkonwn=very negative
haïr	unkonwn=very negative
décevoir	unkonwn=negative
décevant	unkonwn=negative
déception	unkonwn=negative
affreux	unkonwn=very negative
horrible	unkonwn=very negative
terrible	unkonwn=negative
mauvais	unkonwn=negative
pire	unkonwn=negative
nul	unkonwn=negative
casser	unkonwn=negative
cassé	unkonwn=negative
perdre	unkonwn=negative
défaite	unkonwn=negative
peur	unkonwn=negative
craindre	unkonwn=negative
inquiet	unkonwn=negative
inquiéter	unkonwn=negative
stupide	unkonwn=negative
idiot	unkonwn=negative
ennuyeux	unkonwn=negative
ennuyer	unkonwn=negative
fatigué	unkonwn=negative
fatiguer	unkonwn=negative
=mal	unkonwn=negative
douleur	unkonwn=negative
douloureux	unkonwn=negative
malade	unkonwn=negative
bouleverser	unkonwn=negative
déranger	unkonwn=negative
dérangement	unkonwn=negative
agaçant	unkonwn=negative
agacer	unkonwn=negative
frustrant	unkonwn=negative
frustrer	unkonwn=negative
dangereux	unkonwn=negative
inutile	unkonwn=negative
confus	unkonwn=negative
mécontent	unkonwn=negative
malheureux	unkonwn=negative
impoli	unkonwn=negative
pleurer	unkonwn=negative
souffrir	unkonwn=negative
honte	unkonwn=negative
catastrophe	unkonwn=very negative
# Labels of the polarity lexicon that do not hold for these words as they are used.
=tout	unkonwn=none
=tous	unkonwn=none
=toute	unkonwn=none
=toutes	unkonwn=none
=plus	unkonwn=none
=seul	unkonwn=none
=seule	unkonwn=none
=fin	unkonwn=none
